#include "platform/zyn/Bundle.h"

#include <sys/stat.h>
#include <unistd.h>

#include "platform/os/Format.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"

namespace zyn {

namespace {

bool isDirectory(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

bool isFile(const std::string& path) {
  struct stat st;
  return stat(path.c_str(), &st) == 0 && S_ISREG(st.st_mode);
}

std::string parentOf(const std::string& path) {
  auto slash = path.find_last_of('/');
  if (slash == std::string::npos) return ".";
  return slash == 0 ? "/" : path.substr(0, slash);
}

std::optional<std::string> canonical(const std::string& path) {
  auto resolved = os::Paths::canonical(path);
  if (!resolved.ok()) return std::nullopt;
  return resolved.value();
}

}  // namespace

std::shared_ptr<Bundle> Bundle::open(const std::string& path, Mode mode) {
  std::optional<std::string> resolved = canonical(path);
  if (!resolved) return std::shared_ptr<Bundle>(new Bundle(path, std::nullopt, std::nullopt));
  if (mode == Mode::Directory) {
    auto bundlePath = isDirectory(*resolved) ? resolved : std::nullopt;
    return std::shared_ptr<Bundle>(new Bundle(path, bundlePath, std::nullopt));
  }
  std::string parent = parentOf(*resolved);
  bool inBundle = isFile(*resolved) && isFile(parent + "/Info.plist");
  return std::shared_ptr<Bundle>(new Bundle(path, inBundle ? std::optional(parent) : std::nullopt,
                                            inBundle ? resolved : std::nullopt));
}

std::shared_ptr<Bundle> Bundle::mainBundle() {
  return open(canonical("/proc/self/exe").value_or("/proc/self/exe"), Mode::Executable);
}

Bundle::Bundle(std::string requested, std::optional<std::string> bundlePath,
               std::optional<std::string> openedExecutable)
    : requested_(std::move(requested)),
      bundlePath_(std::move(bundlePath)),
      openedExecutable_(std::move(openedExecutable)) {}

std::optional<std::string> Bundle::executablePath() const {
  if (!bundlePath_) return std::nullopt;
  if (auto info = infoDictionary()) {
    const value::Value* name = info->asDictionary()->find("QFBundleExecutable");
    const std::string* text = name ? name->asString() : nullptr;
    if (text && !text->empty() && text->find('/') == std::string::npos &&
        isFile(*bundlePath_ + "/" + *text)) {
      return *bundlePath_ + "/" + *text;
    }
  }
  return openedExecutable_;
}

std::optional<value::Value> Bundle::infoDictionary() const {
  if (!bundlePath_) return std::nullopt;
  auto info = value::PropertyList::readFile(*bundlePath_ + "/Info.plist");
  if (!info.ok() || !info.value().asDictionary()) return std::nullopt;
  return info.value();
}

std::string Bundle::description() const {
  return os::format("<zyn bundle %p path=%s resolved=%s>",
                    {static_cast<const void*>(this), requested_, bundlePath_.value_or("(none)")});
}

}  // namespace zyn
