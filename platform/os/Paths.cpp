#include "platform/os/Paths.h"

#include <fcntl.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <optional>
#include <vector>

namespace os {

namespace {

// An environment variable's value, or nothing when it is unset or empty.
std::optional<std::string> setting(const char* name) {
  const char* value = std::getenv(name);
  if (!value || !*value) return std::nullopt;
  return std::string(value);
}

// An absolute-path setting; the base-directory convention ignores relative ones.
std::optional<std::string> absoluteSetting(const char* name) {
  auto value = setting(name);
  if (!value || value->front() != '/') return std::nullopt;
  return value;
}

std::string join(std::string_view dir, std::string_view relative) {
  while (!relative.empty() && relative.front() == '/') relative.remove_prefix(1);
  std::string path(dir);
  if (path.empty() || path.back() != '/') path.push_back('/');
  path.append(relative);
  return path;
}

std::optional<std::string> passwordHome(uid_t uid) {
  long hint = sysconf(_SC_GETPW_R_SIZE_MAX);
  std::vector<char> buffer(hint > 0 ? static_cast<std::size_t>(hint) : 16384);
  passwd entry{};
  passwd* found = nullptr;
  if (getpwuid_r(uid, &entry, buffer.data(), buffer.size(), &found) != 0 || !found) {
    return std::nullopt;
  }
  if (!found->pw_dir || found->pw_dir[0] != '/') return std::nullopt;
  return std::string(found->pw_dir);
}

std::optional<std::string> homeOf(uid_t uid) {
  if (uid == geteuid()) {
    if (auto home = absoluteSetting("HOME")) return home;
  }
  return passwordHome(uid);
}

}  // namespace

std::string Paths::root() {
  auto value = setting("ANNEXA_ROOT");
  if (!value) return "/";
  while (value->size() > 1 && value->back() == '/') value->pop_back();
  return *value;
}

std::string Paths::runtimeDir() {
  if (setting("ANNEXA_ROOT")) return join(root(), "run");
  if (auto xdg = absoluteSetting("XDG_RUNTIME_DIR")) return *xdg;
  return "/run/user/" + std::to_string(geteuid());
}

std::string Paths::perUserDir(uid_t uid) {
  std::string users = "var/users/" + std::to_string(uid);
  if (setting("ANNEXA_ROOT")) return join(root(), users);
  if (uid == geteuid()) {
    if (auto xdg = absoluteSetting("XDG_STATE_HOME")) return *xdg;
  }
  if (auto home = homeOf(uid)) return join(*home, ".local/state");
  return join("/", users);
}

std::string Paths::underRoot(std::string_view relative) {
  return join(root(), relative);
}

std::string Paths::zynSocketDir() {
  return join(runtimeDir(), "zyn");
}

Result<std::string> Paths::canonical(const std::string& path) {
  std::unique_ptr<char, decltype(&std::free)> resolved(realpath(path.c_str(), nullptr), &std::free);
  if (!resolved) return Error::fromErrno("realpath " + path);
  return std::string(resolved.get());
}

Status Paths::ensureDirectory(const std::string& path, mode_t mode) {
  struct stat st {};
  if (stat(path.c_str(), &st) == 0) {
    if (S_ISDIR(st.st_mode)) return success();
    return Error{ENOTDIR, "ensureDirectory " + path + ": not a directory"};
  }
  if (errno != ENOENT) return Error::fromErrno("stat " + path);
  std::size_t end = path.find_last_not_of('/');
  std::size_t slash = end == std::string::npos ? end : path.rfind('/', end);
  if (slash != std::string::npos && slash > 0) {
    Status parent = ensureDirectory(path.substr(0, slash), mode);
    if (!parent.ok()) return parent;
  }
  if (mkdir(path.c_str(), mode) == 0) return success();
  Error failed = Error::fromErrno("mkdir " + path);
  // Another process may have made it in the meantime; then it only has to be a directory.
  if (failed.errnum == EEXIST && stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode)) {
    return success();
  }
  return failed;
}

Status Paths::ensurePrivateDirectory(const std::string& path) {
  Status made = ensureDirectory(path, 0700);
  if (!made.ok() && made.error().errnum != ENOTDIR) return made;
  int fd = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + path);
  Status status = fchmod(fd, 0700) == 0 ? success() : Error::fromErrno("chmod " + path);
  close(fd);
  return status;
}

Status Paths::ensureRuntimeDirectory(const std::string& path, mode_t mode) {
  std::size_t slash = path.find_last_of('/');
  if (slash != std::string::npos && slash > 0) {
    Status parent = ensureDirectory(path.substr(0, slash), 0755);
    if (!parent.ok()) return parent;
  }
  bool made = mkdir(path.c_str(), mode) == 0;
  if (!made && errno != EEXIST) return Error::fromErrno("mkdir " + path);
  int fd = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + path);
  struct stat st {};
  Status status = fstat(fd, &st) == 0 ? success() : Error::fromErrno("stat " + path);
  if (status.ok() && made && fchmod(fd, mode) != 0) status = Error::fromErrno("chmod " + path);
  if (status.ok() && !made && (st.st_uid != geteuid() || (st.st_mode & 07777) != mode)) {
    char found[96];
    std::snprintf(found, sizeof found, "owned by uid %u with mode %04o, not uid %u with %04o",
                  st.st_uid, st.st_mode & 07777, geteuid(), mode);
    status = Error{EPERM, path + " is " + found + ": refusing to use it"};
  }
  close(fd);
  return status;
}

}  // namespace os
