#include "platform/launcher/ServiceLauncher.h"

#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <optional>
#include <tuple>

#include "platform/codesign/DigestCache.h"
#include "platform/launcher/CleanSpawn.h"
#include "platform/launcher/ServiceFile.h"
#include "platform/launcher/ServiceName.h"
#include "platform/launcher/TableLock.h"
#include "platform/os/AtomicFile.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"
#include "platform/value/Value.h"

namespace launcher {

namespace {

using Service = ServiceLauncher::Service;

constexpr int kLogError = 3;
constexpr int kLogWarning = 4;
constexpr std::string_view kSuffix = ".plist";

std::string tableDir() {
  return os::Paths::runtimeDir() + "/launcher";
}

std::string serviceDir(const std::string& bundleIdentifier, const std::string& version) {
  return tableDir() + "/" + ServiceName::escape(bundleIdentifier) + "/" +
         ServiceName::escape(version);
}

std::string serviceFile(const std::string& bundleIdentifier, const std::string& version,
                        pid_t host) {
  return serviceDir(bundleIdentifier, version) + "/" + std::to_string(host) + std::string(kSuffix);
}

os::Status checkNames(const std::string& bundleIdentifier, const std::string& version) {
  if (!bundleIdentifier.empty() && !version.empty()) return os::success();
  return os::Error{EINVAL, "launcher: empty bundle identifier or version"};
}

// When |host| started, which also tells that it exists: its stat file is there for any process,
// another user's and a zombie whose parent has not yet learnt of its end included.
os::Result<std::uint64_t> hostStartTime(pid_t host) {
  os::Result<std::uint64_t> started = os::Process::startTime(host);
  if (started.ok()) return started;
  return os::Error{ESRCH, os::format("launcher: no process %d", {host})};
}

// Refuses at addition what exec would refuse at start. A relative path would be resolved against
// the host's working directory, not ours.
os::Status checkExecutable(const std::string& path) {
  if (!path.starts_with('/') || path.find('\0') != std::string::npos) {
    return os::Error{EINVAL, "launcher: executable path is not absolute: " + path};
  }
  struct stat status;
  if (stat(path.c_str(), &status) != 0) return os::Error::fromErrno("launcher: stat " + path);
  if (!S_ISREG(status.st_mode)) return os::Error{EACCES, "launcher: not a regular file: " + path};
  if (faccessat(AT_FDCWD, path.c_str(), X_OK, AT_EACCESS) != 0) {
    return os::Error::fromErrno("launcher: execute " + path);
  }
  return os::success();
}

// The host of a service file name "<pid>.plist" (pid in its one decimal spelling), or nothing.
std::optional<pid_t> hostOf(std::string_view name) {
  if (name.size() <= kSuffix.size() || !name.ends_with(kSuffix)) return std::nullopt;
  std::string_view digits = name.substr(0, name.size() - kSuffix.size());
  pid_t host = 0;
  auto [end, error] = std::from_chars(digits.data(), digits.data() + digits.size(), host);
  if (error != std::errc() || end != digits.data() + digits.size() || host <= 0)
    return std::nullopt;
  if (std::to_string(host) != digits) return std::nullopt;
  return host;
}

// The names in |dir| except those starting with '.': ".", "..", the lock and temporary files.
os::Result<std::vector<std::string>> entries(const std::string& dir) {
  struct CloseDir {
    void operator()(DIR* stream) const { closedir(stream); }
  };
  std::unique_ptr<DIR, CloseDir> stream(opendir(dir.c_str()));
  if (!stream) return os::Error::fromErrno("opendir " + dir);
  std::vector<std::string> names;
  errno = 0;
  while (const dirent* entry = readdir(stream.get())) {
    if (entry->d_name[0] != '.') names.emplace_back(entry->d_name);
  }
  if (errno != 0) return os::Error::fromErrno("readdir " + dir);
  return names;
}

void skip(const std::string& path, const std::string& why) {
  os::Log::write(kLogWarning, "launcher: skipping " + path + ": " + why);
}

// Appends the services in |dir|, the directory of one identifier and version.
void collectHosts(const std::string& dir, const std::string& bundleIdentifier,
                  const std::string& version, std::vector<Service>& out) {
  os::Result<std::vector<std::string>> names = entries(dir);
  if (!names.ok()) {
    skip(dir, names.error().message);
    return;
  }
  for (const std::string& name : names.value()) {
    std::optional<pid_t> host = hostOf(name);
    if (!host) {
      skip(dir + "/" + name, "not a service file");
      continue;
    }
    os::Result<ServiceFile::Contents> read = ServiceFile::read(dir + "/" + name);
    if (!read.ok()) {
      skip(dir + "/" + name, read.error().message);
      continue;
    }
    out.push_back({*host, bundleIdentifier, version, std::move(read.value().executablePath),
                   std::move(read.value().description)});
  }
}

// Appends the services in |dir|, the directory of one identifier.
void collectVersions(const std::string& dir, const std::string& bundleIdentifier,
                     std::vector<Service>& out) {
  os::Result<std::vector<std::string>> names = entries(dir);
  if (!names.ok()) {
    skip(dir, names.error().message);
    return;
  }
  for (const std::string& name : names.value()) {
    std::optional<std::string> version = ServiceName::unescape(name);
    if (!version) {
      skip(dir + "/" + name, "not an escaped version");
      continue;
    }
    collectHosts(dir + "/" + name, bundleIdentifier, *version, out);
  }
}

// Removes the directory of one identifier and version, with the table locked exclusive.
int removeLocked(const std::string& bundleIdentifier, const std::string& version) {
  const std::string dir = serviceDir(bundleIdentifier, version);
  os::Result<std::vector<std::string>> names = entries(dir);
  // No file can have a name too long to exist, so neither can its service.
  if (!names.ok() && (names.error().errnum == ENOENT || names.error().errnum == ENAMETOOLONG)) {
    return ServiceLauncher::kNoSuchService;
  }
  if (!names.ok()) {
    os::Log::write(kLogError, "launcher: " + names.error().message);
    return names.error().errnum;
  }
  std::error_code failed;
  std::filesystem::remove_all(dir, failed);
  if (failed) {
    os::Log::write(kLogError, "launcher: removing " + dir + ": " + failed.message());
    return failed.value();
  }
  // The identifier's directory goes with its last version; another version keeps it.
  rmdir(dir.substr(0, dir.rfind('/')).c_str());
  bool removed = std::any_of(names.value().begin(), names.value().end(),
                             [](const std::string& name) { return hostOf(name).has_value(); });
  return removed ? 0 : ServiceLauncher::kNoSuchService;
}

bool isSelf(std::uint64_t hostStartTime) {
  os::Result<std::uint64_t> self = os::Process::startTime(getpid());
  return self.ok() && self.value() == hostStartTime;
}

// The service recorded for this process, read with the table locked shared. A missing table,
// directory or file all mean that this process was not made ready for the service.
os::Result<ServiceFile::Contents> readOwnService(const std::string& bundleIdentifier,
                                                 const std::string& version) {
  const pid_t self = getpid();
  os::Result<TableLock> lock = TableLock::acquire(tableDir(), TableLock::Mode::Shared);
  if (!lock.ok() && lock.error().errnum != ENOENT) return lock.error();
  if (lock.ok()) {
    os::Result<ServiceFile::Contents> read =
        ServiceFile::read(serviceFile(bundleIdentifier, version, self));
    const int errnum = read.ok() ? 0 : read.error().errnum;
    // A record of an earlier process that had this pid is not this process's.
    if (read.ok() && isSelf(read.value().hostStartTime)) return read;
    if (errnum != 0 && errnum != ENOENT && errnum != ENOTDIR && errnum != ENAMETOOLONG) return read;
  }
  return os::Error{EPERM, os::format("launcher: process %d was not made ready for %s %s",
                                     {self, bundleIdentifier, version})};
}

// "NAME=value" for each string entry of the description's "ZynService" "EnvironmentVariables".
std::vector<std::string> environmentOf(const value::Dictionary& description) {
  std::vector<std::string> environment;
  const value::Value* service = description.find("ZynService");
  const value::Dictionary* settings = service ? service->asDictionary() : nullptr;
  const value::Value* variables = settings ? settings->find("EnvironmentVariables") : nullptr;
  if (!variables || !variables->asDictionary()) return environment;
  for (const auto& [name, value] : *variables->asDictionary()) {
    // A name with '=' would read back as another variable.
    if (!value.asString() || name.empty() || name.find('=') != std::string::npos) {
      os::Log::write(kLogWarning, "launcher: skipping environment entry \"" + name +
                                      "\": not a variable name with a string value");
      continue;
    }
    environment.push_back(name + "=" + *value.asString());
  }
  return environment;
}

// The SHA-256 the description's "ZynService" says the executable must have, when it says one.
std::optional<std::string> signedDigest(const value::Dictionary& description) {
  const value::Value* service = description.find("ZynService");
  const value::Dictionary* entries = service ? service->asDictionary() : nullptr;
  const value::Value* digest =
      entries ? entries->find(ServiceLauncher::kExecutableDigestKey) : nullptr;
  if (!digest || !digest->asString()) return std::nullopt;
  return *digest->asString();
}

}  // namespace

os::Status ServiceLauncher::addService(pid_t host, const std::string& bundleIdentifier,
                                       const std::string& version,
                                       const std::string& executablePath,
                                       const value::Dictionary& description) {
  os::Status valid = checkNames(bundleIdentifier, version);
  if (!valid.ok()) return valid;
  os::Result<std::uint64_t> started = hostStartTime(host);
  if (!started.ok()) return started.error();
  valid = checkExecutable(executablePath);
  if (!valid.ok()) return valid;
  os::Result<std::string> xml = ServiceFile::encode({executablePath, description, started.value()});
  if (!xml.ok()) return xml.error();
  os::Status made = os::Paths::ensureRuntimeDirectory(tableDir(), 0700);
  if (!made.ok()) return made;
  os::Result<TableLock> lock = TableLock::acquire(tableDir(), TableLock::Mode::Shared);
  if (!lock.ok()) return lock.error();
  const std::string dir = serviceDir(bundleIdentifier, version);
  made = os::Paths::ensureDirectory(dir, 0700);
  if (!made.ok()) return made;
  // No fsync: the runtime directory does not outlive a reboot.
  return os::AtomicFile::replace(serviceFile(bundleIdentifier, version, host), xml.value(),
                                 os::AtomicFile::Durability::Volatile);
}

os::Result<pid_t> ServiceLauncher::start(const std::string& bundleIdentifier,
                                         const std::string& version) {
  os::Status valid = checkNames(bundleIdentifier, version);
  if (!valid.ok()) return valid.error();
  os::Result<ServiceFile::Contents> service = readOwnService(bundleIdentifier, version);
  if (!service.ok()) return service.error();
  const std::string& executable = service.value().executablePath;
  std::vector<std::string> environment = environmentOf(service.value().description);
  std::optional<std::string> digest = signedDigest(service.value().description);
  if (!digest) return CleanSpawn::run(executable, environment);
  return startChecked(executable, *digest, environment);
}

os::Result<pid_t> ServiceLauncher::startChecked(const std::string& executable,
                                                const std::string& digest,
                                                const std::vector<std::string>& environment) {
  int opened = open(executable.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK);
  if (opened < 0) return os::Error::fromErrno("launcher: " + executable);
  // Above the descriptor the child gets it as, which dup2 would leave marked close-on-exec.
  int fd = fcntl(opened, F_DUPFD_CLOEXEC, CleanSpawn::kExecutableDescriptor + 1);
  close(opened);
  if (fd < 0) return os::Error::fromErrno("launcher: " + executable);
  os::Result<std::string> actual = codesign::DigestCache::shared().sha256(fd, executable);
  os::Result<pid_t> child =
      os::Error{EPERM, "launcher: " + executable + " is not the executable its bundle signed"};
  if (actual.ok() && actual.value() == digest) {
    child = CleanSpawn::runOpened(executable, fd, environment);
  } else {
    os::Log::write(kLogError, child.error().message);
  }
  close(fd);
  return child;
}

int ServiceLauncher::removeService(const std::string& bundleIdentifier,
                                   const std::string& version) {
  os::Status valid = checkNames(bundleIdentifier, version);
  if (!valid.ok()) return valid.error().errnum;
  os::Result<TableLock> lock = TableLock::acquire(tableDir(), TableLock::Mode::Exclusive);
  if (!lock.ok() && lock.error().errnum == ENOENT) return kNoSuchService;  // no table yet
  if (!lock.ok()) {
    os::Log::write(kLogError, "launcher: " + lock.error().message);
    return lock.error().errnum;
  }
  return removeLocked(bundleIdentifier, version);
}

void ServiceLauncher::removeService(const std::string& bundleIdentifier, const std::string& version,
                                    const std::shared_ptr<zyn::SerialQueue>& queue,
                                    std::function<void(int)> completion) {
  auto work = [bundleIdentifier, version, completion = std::move(completion)] {
    int result = removeService(bundleIdentifier, version);
    if (completion) completion(result);
  };
  if (queue) {
    queue->async(std::move(work));
  } else {
    work();
  }
}

os::Result<std::vector<ServiceLauncher::Service>> ServiceLauncher::services() {
  const std::string dir = tableDir();
  std::vector<Service> found;
  os::Result<TableLock> lock = TableLock::acquire(dir, TableLock::Mode::Shared);
  if (!lock.ok() && lock.error().errnum == ENOENT) return found;  // no table yet
  if (!lock.ok()) return lock.error();
  os::Result<std::vector<std::string>> names = entries(dir);
  if (!names.ok()) return names.error();
  for (const std::string& name : names.value()) {
    std::optional<std::string> bundleIdentifier = ServiceName::unescape(name);
    if (!bundleIdentifier) {
      skip(dir + "/" + name, "not an escaped bundle identifier");
      continue;
    }
    collectVersions(dir + "/" + name, *bundleIdentifier, found);
  }
  std::sort(found.begin(), found.end(), [](const Service& a, const Service& b) {
    return std::tie(a.host, a.bundleIdentifier, a.version) <
           std::tie(b.host, b.bundleIdentifier, b.version);
  });
  return found;
}

}  // namespace launcher
