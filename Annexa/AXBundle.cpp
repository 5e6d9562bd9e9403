#include "Annexa/AXBundle.h"

#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/value/PlistBridge.h"

std::shared_ptr<AXBundle> AXBundle::initForMainBundle() {
  return std::make_shared<AXBundle>(zyn::Bundle::mainBundle());
}

std::shared_ptr<AXBundle> AXBundle::initWithURL(const AXFileURL& url) {
  return initWithPath(url.path());
}

std::shared_ptr<AXBundle> AXBundle::initWithPath(const std::string& path) {
  return std::make_shared<AXBundle>(zyn::Bundle::open(path, zyn::Bundle::Mode::Directory));
}

std::shared_ptr<AXBundle> AXBundle::initWithExecutableURL(const AXFileURL& url) {
  return initWithExecutablePath(url.path());
}

std::shared_ptr<AXBundle> AXBundle::initWithExecutablePath(const std::string& path) {
  auto bundle = zyn::Bundle::open(path, zyn::Bundle::Mode::Executable);
  if (!bundle->bundlePath()) bundle = zyn::Bundle::open(path, zyn::Bundle::Mode::Directory);
  return std::make_shared<AXBundle>(std::move(bundle));
}

std::optional<AXFileURL> AXBundle::url() const {
  auto p = path();
  if (!p) return std::nullopt;
  return AXFileURL(*p);
}

std::optional<std::string> AXBundle::executablePath() const {
  if (auto executable = _bundle->executablePath()) return executable;
  return _bundle->bundlePath();
}

std::optional<std::string> AXBundle::supportPath() const {
  // The support path can't change for an opened bundle, so one computation serves all threads.
  std::call_once(supportOnce_, [this] { supportPath_ = _bundle->supportPath(); });
  return supportPath_;
}

std::optional<std::string> AXBundle::bundleDirectory(const std::string& name) const {
  auto support = supportPath();
  if (!support) return std::nullopt;
  return *support + "/" + name;
}

std::optional<value::Dictionary> AXBundle::infoDictionary() const {
  std::optional<value::Value> info = _bundle->infoDictionary();
  if (!info) {
    os::Log::write(5, os::format("failed to retrieve Info.plist for %@ through %@",
                                 {path().value_or("(null)"), _bundle->description()}));
  }
  std::optional<value::Value> converted = info ? value::PlistBridge::toPlist(*info) : std::nullopt;
  if (!converted || !converted->asDictionary()) {
    os::Log::write(5, os::format("failed to convert Info.plist to dictionary: %@ source=%@",
                                 {path().value_or("(null)"),
                                  info ? info->description() : std::string("(null)")}));
    return std::nullopt;
  }
  return *converted->asDictionary();
}

std::optional<std::string> AXBundle::bundleIdentifier() const {
  std::optional<value::Value> info = _bundle->infoDictionary();
  if (!info) return std::nullopt;
  const value::Value* identifier = info->asDictionary()->find("QFBundleIdentifier");
  if (!identifier || !identifier->asString()) return std::nullopt;
  return *identifier->asString();
}
