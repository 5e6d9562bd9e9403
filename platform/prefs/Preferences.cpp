#include "platform/prefs/Preferences.h"

#include <unistd.h>

#include <cerrno>
#include <map>
#include <mutex>

#include "platform/os/Paths.h"
#include "platform/prefs/DomainFile.h"

namespace prefs {

namespace {

// The domain files read by this process, by path.
struct Cache {
  std::mutex mutex;
  std::map<std::string, DomainFile> files;
};

// Never destroyed: a thread may still ask while the process exits.
Cache& cache() {
  static Cache* const instance = new Cache;
  return *instance;
}

bool valid(const std::string& domain) {
  return !domain.empty() && domain != "." && domain != ".." &&
         domain.find_first_of(std::string("/\0", 2)) == std::string::npos;
}

os::Error invalid(const std::string& domain) {
  return os::Error{EINVAL, "preferences: invalid domain name \"" + domain + "\""};
}

std::string directory() {
  return os::Paths::perUserDir(geteuid()) + "/Preferences";
}

std::string pathOf(const std::string& domain) {
  return directory() + "/" + domain + ".plist";
}

// The cached file at |path|. Call with the cache's lock held.
DomainFile& fileAt(const std::string& path) {
  return cache().files.try_emplace(path, path).first->second;
}

}  // namespace

os::Status Preferences::synchronize(const std::string& domain) {
  if (!valid(domain)) return invalid(domain);
  std::lock_guard lock(cache().mutex);
  fileAt(pathOf(domain)).synchronize();
  return os::success();
}

std::optional<value::Value> Preferences::copyValue(const std::string& key,
                                                   const std::string& domain) {
  if (!valid(domain)) return std::nullopt;
  std::lock_guard lock(cache().mutex);
  DomainFile& file = fileAt(pathOf(domain));
  if (!file.synchronized()) file.synchronize();
  if (!file.contents()) return std::nullopt;
  const value::Value* found = file.contents()->find(key);
  return found ? std::optional(*found) : std::nullopt;
}

os::Status Preferences::setValue(const std::string& key, const std::optional<value::Value>& value,
                                 const std::string& domain) {
  if (!valid(domain)) return invalid(domain);
  std::lock_guard lock(cache().mutex);
  std::string path = pathOf(domain);
  os::Result<value::Dictionary> current = DomainFile::read(path);
  if (!current.ok() && current.error().errnum != ENOENT) return current.error();
  value::Dictionary contents = current.ok() ? current.value() : value::Dictionary();
  contents = value ? contents.with(key, *value) : contents.without(key);
  os::Status made = os::Paths::ensureDirectory(directory(), 0700);
  if (!made.ok()) return made;
  os::Status written = DomainFile::write(path, contents);
  if (written.ok()) fileAt(path).synchronize();
  return written;
}

}  // namespace prefs
