#include "platform/codesign/EntitlementTable.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cstring>
#include <filesystem>
#include <string_view>
#include <vector>

#include "platform/codesign/DigestCache.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace codesign {

namespace {

constexpr std::string_view kTableDir = "etc/annexa/entitlements.d";
constexpr std::string_view kSuffix = ".plist";

void skip(const std::string& path, std::string_view why) {
  os::Log::write(5, os::format("entitlement table: ignoring %s: %s", {path, why}));
}

bool isTableFileName(const std::string& name) {
  return name.size() > kSuffix.size() && name.front() != '.' && name.ends_with(kSuffix);
}

// 64 hexadecimal digits in lower case, or nothing when |text| is not a SHA-256 digest.
std::optional<std::string> normalizedDigest(const std::string& text) {
  if (text.size() != 64) return std::nullopt;
  std::string digest;
  for (unsigned char c : text) {
    if (!std::isxdigit(c)) return std::nullopt;
    digest.push_back(static_cast<char>(std::tolower(c)));
  }
  return digest;
}

// Why a table file must not be trusted, or nothing when only root or the daemon's user can
// have written it.
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

// The executable as the kernel would name it; a path that does not resolve stays as written.
std::string canonicalExecutable(const std::string& path) {
  auto resolved = os::Paths::canonical(path);
  return resolved.ok() ? resolved.value() : path;
}

}  // namespace

os::Result<EntitlementTable> EntitlementTable::load() {
  std::string dir = os::Paths::underRoot(kTableDir);
  std::error_code ec;
  std::filesystem::directory_iterator it(dir, ec);
  if (ec == std::errc::no_such_file_or_directory) return EntitlementTable();
  std::vector<std::string> names;
  for (; !ec && it != std::filesystem::directory_iterator(); it.increment(ec)) {
    std::string name = it->path().filename().string();
    if (isTableFileName(name)) names.push_back(std::move(name));
  }
  if (ec) return os::Error{ec.value(), "entitlement table " + dir + ": " + ec.message()};
  std::sort(names.begin(), names.end());
  EntitlementTable table;
  for (const std::string& name : names) {
    if (auto entry = readFile(dir + "/" + name)) table.entries_.push_back(std::move(*entry));
  }
  return table;
}

std::optional<EntitlementTable::Entry> EntitlementTable::readFile(const std::string& path) {
  // Non-blocking, so that a FIFO in the directory cannot stall the daemon; never through a
  // symbolic link, which would let whoever may write its target grant entitlements.
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOFOLLOW);
  if (fd < 0) {
    skip(path, std::strerror(errno));
    return std::nullopt;
  }
  os::Result<value::Value> file = readTrusted(fd);
  close(fd);
  if (!file.ok()) {
    skip(path, file.error().message);
    return std::nullopt;
  }
  os::Result<Entry> entry = entryFrom(path, file.value());
  if (!entry.ok()) {
    skip(path, entry.error().message);
    return std::nullopt;
  }
  return std::move(entry).value();
}

os::Result<EntitlementTable::Entry> EntitlementTable::entryFrom(const std::string& source,
                                                                const value::Value& file) {
  const value::Dictionary* dict = file.asDictionary();
  if (!dict) return os::Error{EINVAL, "not a dictionary"};
  const value::Value* executable = dict->find("Executable");
  const std::string* executablePath = executable ? executable->asString() : nullptr;
  if (!executablePath || !executablePath->starts_with('/')) {
    return os::Error{EINVAL, "\"Executable\" is missing or not an absolute path"};
  }
  Entry entry{source, canonicalExecutable(*executablePath), std::nullopt, {}};
  if (const value::Value* digest = dict->find("SHA256")) {
    const std::string* text = digest->asString();
    entry.sha256 = text ? normalizedDigest(*text) : std::nullopt;
    if (!entry.sha256) return os::Error{EINVAL, "\"SHA256\" is not 64 hexadecimal digits"};
  }
  if (const value::Value* entitlements = dict->find("Entitlements")) {
    if (!entitlements->asDictionary()) {
      return os::Error{EINVAL, "\"Entitlements\" is not a dictionary"};
    }
    entry.entitlements = *entitlements->asDictionary();
  }
  return entry;
}

std::optional<value::Dictionary> EntitlementTable::lookup(const std::string& path,
                                                          int executableFd) const {
  std::optional<std::string> imageDigest;
  bool digested = false;
  for (const Entry& entry : entries_) {
    if (entry.executable != path) continue;
    if (!entry.sha256) return entry.entitlements;
    if (!digested && executableFd >= 0) {
      auto digest = DigestCache::shared().sha256(executableFd, path);
      if (digest.ok()) imageDigest = digest.value();
    }
    digested = true;
    if (imageDigest == entry.sha256) return entry.entitlements;
    os::Log::write(5, os::format("entitlement table: %s does not match the SHA256 in %s",
                                 {path, entry.source}));
  }
  return std::nullopt;
}

}  // namespace codesign
