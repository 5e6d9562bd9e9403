#include "platform/launcher/ServiceLauncher.h"

#include <dirent.h>
#include <fcntl.h>
#include <signal.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <filesystem>
#include <optional>
#include <tuple>

#include "platform/launcher/ServiceName.h"
#include "platform/launcher/TableLock.h"
#include "platform/os/AtomicFile.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"
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

os::Status checkNames(const std::string& bundleIdentifier, const std::string& version) {
  if (!bundleIdentifier.empty() && !version.empty()) return os::success();
  return os::Error{EINVAL, "launcher: empty bundle identifier or version"};
}

// A process we may not signal exists all the same; so does a zombie, whose parent has not yet
// learnt of its end.
os::Status checkHost(pid_t host) {
  if (host > 0 && (kill(host, 0) == 0 || errno == EPERM)) return os::success();
  return os::Error{ESRCH, os::format("launcher: no process %d", {host})};
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

os::Result<value::Dictionary> readDescription(const std::string& path) {
  os::Result<value::Value> read = value::PropertyList::readFile(path);
  if (!read.ok()) return read.error();
  if (const value::Dictionary* description = read.value().asDictionary()) return *description;
  return os::Error{EINVAL, path + ": not a dictionary"};
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
    os::Result<value::Dictionary> description = readDescription(dir + "/" + name);
    if (!description.ok()) {
      skip(dir + "/" + name, description.error().message);
      continue;
    }
    out.push_back({*host, bundleIdentifier, version, std::move(description).value()});
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

}  // namespace

os::Status ServiceLauncher::addService(pid_t host, const std::string& bundleIdentifier,
                                       const std::string& version,
                                       const value::Dictionary& description) {
  os::Status valid = checkNames(bundleIdentifier, version);
  if (valid.ok()) valid = checkHost(host);
  if (!valid.ok()) return valid;
  os::Result<std::string> xml = value::PropertyList::toXml(value::Value::dictionary(description));
  if (!xml.ok()) return xml.error();
  os::Status made = os::Paths::ensureDirectory(tableDir(), 0700);
  if (!made.ok()) return made;
  os::Result<TableLock> lock = TableLock::acquire(tableDir(), TableLock::Mode::Shared);
  if (!lock.ok()) return lock.error();
  const std::string dir = serviceDir(bundleIdentifier, version);
  made = os::Paths::ensureDirectory(dir, 0700);
  if (!made.ok()) return made;
  // No fsync: the runtime directory does not outlive a reboot.
  return os::AtomicFile::replace(dir + "/" + std::to_string(host) + std::string(kSuffix),
                                 xml.value(), os::AtomicFile::Durability::Volatile);
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
