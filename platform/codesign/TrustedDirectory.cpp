#include "platform/codesign/TrustedDirectory.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <optional>

#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/value/PropertyList.h"

namespace codesign {

namespace {

constexpr std::string_view kSuffix = ".plist";

bool isListedName(const std::string& name) {
  return name.size() > kSuffix.size() && name.front() != '.' && name.ends_with(kSuffix);
}

// Why a file must not be trusted, or nothing when only root or the daemon's user can have
// written it.
std::optional<std::string> untrusted(const struct stat& st) {
  if (!S_ISREG(st.st_mode)) return "not a regular file";
  if (st.st_uid != 0 && st.st_uid != geteuid()) {
    return os::format("owned by uid %u, neither root nor the daemon's user", {st.st_uid});
  }
  if (st.st_mode & (S_IWGRP | S_IWOTH)) return "writable by group or others";
  return std::nullopt;
}

// The property list behind |fd|, when only root or the daemon's user can have written it. The
// check and the read go through one descriptor, so they see the same file.
os::Result<value::Value> readTrusted(int fd) {
  struct stat st {};
  if (fstat(fd, &st) != 0) return os::Error::fromErrno("fstat");
  if (auto why = untrusted(st)) return os::Error{EPERM, *why};
  std::vector<std::uint8_t> bytes;
  std::uint8_t buffer[8192];
  // Past kMaxBytes the reader refuses the file whole, so reading stops there.
  while (bytes.size() <= value::PropertyList::kMaxBytes) {
    ssize_t n = read(fd, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("read");
    if (n == 0) break;
    bytes.insert(bytes.end(), buffer, buffer + n);
  }
  return value::PropertyList::read(bytes);
}

os::Result<value::Value> readFile(const std::string& path) {
  // Never through a symbolic link, which would let whoever may write its target decide.
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW);
  if (fd < 0) return os::Error{errno, std::strerror(errno)};
  os::Result<value::Value> contents = readTrusted(fd);
  close(fd);
  return contents;
}

}  // namespace

os::Result<std::vector<TrustedDirectory::File>> TrustedDirectory::load(std::string_view directory,
                                                                       std::string_view what) {
  std::string dir(directory);
  std::error_code ec;
  std::filesystem::directory_iterator it(dir, ec);
  if (ec == std::errc::no_such_file_or_directory) return std::vector<File>();
  std::vector<std::string> names;
  for (; !ec && it != std::filesystem::directory_iterator(); it.increment(ec)) {
    std::string name = it->path().filename().string();
    if (isListedName(name)) names.push_back(std::move(name));
  }
  if (ec) return os::Error{ec.value(), std::string(what) + " " + dir + ": " + ec.message()};
  std::sort(names.begin(), names.end());
  std::vector<File> files;
  for (const std::string& name : names) {
    std::string path = dir + "/" + name;
    os::Result<value::Value> contents = readFile(path);
    if (contents.ok()) {
      files.push_back({path, std::move(contents).value()});
    } else {
      skip(what, path, contents.error().message);
    }
  }
  return files;
}

void TrustedDirectory::skip(std::string_view what, const std::string& path, std::string_view why) {
  os::Log::write(5, os::format("%s: ignoring %s: %s", {what, path, why}));
}

}  // namespace codesign
