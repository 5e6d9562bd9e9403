#include "platform/sandbox/Sandbox.h"

#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdlib>

#include "platform/os/Paths.h"
#include "platform/sandbox/BootKey.h"
#include "platform/sandbox/ExtensionToken.h"
#include "platform/sandbox/FileReading.h"
#include "platform/sandbox/GrantTable.h"

namespace sandbox {

namespace {

// /proc/<pid>/status is about 1.5 KiB; the limit only guards against a surprise.
constexpr std::size_t kStatusLimit = 1 << 16;

// An error of a /proc read, with a missing entry reported as a missing process.
os::Error processError(os::Error error) {
  if (error.errnum == ENOENT) error.errnum = ESRCH;
  return error;
}

// The "Seccomp:" field of |pid|'s status: 0 none, 1 strict, 2 filter. A kernel without seccomp
// has no such field, which reads as 0.
os::Result<long> seccompMode(pid_t pid) {
  std::string path = "/proc/" + std::to_string(pid) + "/status";
  os::Result<std::string> status = FileReading::readUpTo(path, kStatusLimit);
  if (!status.ok()) return processError(status.error());
  std::size_t field = status.value().find("\nSeccomp:");
  if (field == std::string::npos) return 0L;
  return std::strtol(status.value().c_str() + field + 9, nullptr, 10);
}

os::Result<std::string> namespaceLink(const std::string& process, const char* kind) {
  std::string path = "/proc/" + process + "/ns/" + kind;
  char target[256];
  ssize_t n = readlink(path.c_str(), target, sizeof target);
  if (n < 0) return processError(os::Error::fromErrno("readlink " + path));
  return std::string(target, static_cast<std::size_t>(n));
}

// Whether |pid| shares the calling process's namespace of |kind| ("mnt", "user").
os::Result<bool> sharesNamespace(pid_t pid, const char* kind) {
  os::Result<std::string> theirs = namespaceLink(std::to_string(pid), kind);
  if (!theirs.ok()) return theirs.error();
  os::Result<std::string> ours = namespaceLink("self", kind);
  if (!ours.ok()) return ours.error();
  return theirs.value() == ours.value();
}

bool validClass(std::string_view extensionClass) {
  return !extensionClass.empty() && extensionClass.find(';') == std::string_view::npos;
}

// The path a token names: canonical, or as given when it is absolute and exists.
os::Result<std::string> tokenPath(const std::string& path, bool canonicalize) {
  if (path.find('\0') != std::string::npos) return os::Error{EINVAL, "path contains NUL"};
  if (canonicalize) return os::Paths::canonical(path);
  if (path.empty() || path.front() != '/') return os::Error{EINVAL, "path is not absolute"};
  struct stat st {};
  if (stat(path.c_str(), &st) != 0) return os::Error::fromErrno("stat " + path);
  return path;
}

}  // namespace

os::Result<bool> Sandbox::isSandboxed(pid_t pid) {
  os::Result<long> seccomp = seccompMode(pid);
  if (!seccomp.ok()) return seccomp.error();
  if (seccomp.value() != 0) return true;
  for (const char* kind : {"mnt", "user"}) {
    os::Result<bool> shared = sharesNamespace(pid, kind);
    if (!shared.ok()) return shared.error();
    if (!shared.value()) return true;
  }
  return false;
}

os::Result<std::string> Sandbox::issueFileExtension(std::string_view extensionClass,
                                                    const std::string& path, bool canonicalize) {
  if (!validClass(extensionClass)) return os::Error{EINVAL, "invalid extension class"};
  os::Result<std::string> named = tokenPath(path, canonicalize);
  if (!named.ok()) return named;
  os::Result<std::string> key = BootKey::load();
  if (!key.ok()) return key;
  return ExtensionToken(std::string(extensionClass), named.value()).seal(key.value());
}

std::string Sandbox::sealReadExtension(const std::string& path, const std::string& key) {
  return ExtensionToken(kReadExtensionClass, path).seal(key);
}

os::Result<std::int64_t> Sandbox::consume(std::string_view token) {
  os::Result<std::string> key = BootKey::load();
  if (!key.ok()) return key.error();
  os::Result<ExtensionToken> extension = ExtensionToken::open(token, key.value());
  if (!extension.ok()) return extension.error();
  struct stat st {};
  const std::string& path = extension.value().path();
  if (stat(path.c_str(), &st) != 0) return os::Error::fromErrno("stat " + path);
  return GrantTable::shared().add(std::move(extension).value());
}

os::Status Sandbox::release(std::int64_t handle) {
  if (!GrantTable::shared().remove(handle)) {
    return os::Error{EBADF, "no extension with handle " + std::to_string(handle)};
  }
  return os::success();
}

}  // namespace sandbox
