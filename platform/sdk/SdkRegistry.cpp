#include "platform/sdk/SdkRegistry.h"

#include <cerrno>

#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"

namespace sdk {

namespace {

constexpr int kLogWarning = 4;
constexpr int kLogNotice = 5;

}  // namespace

const SdkRegistry& SdkRegistry::shared() {
  static const SdkRegistry current;
  return current;
}

SdkRegistry::SdkRegistry(std::string root) : root_(std::move(root)) {}

std::string SdkRegistry::rootDirectory() const {
  std::string root = root_ ? *root_ : os::Paths::root();
  while (!root.empty() && root.back() == '/') root.pop_back();
  return root;
}

std::optional<std::string> SdkRegistry::pathForIdentifier(std::string_view identifier) const {
  if (identifier.empty() || identifier.front() == '.' ||
      identifier.find_first_of(std::string_view("/\0", 2)) != std::string_view::npos) {
    return std::nullopt;
  }
  return rootDirectory() + "/System/Library/SDKs/" + std::string(identifier) + ".plist";
}

std::optional<value::Dictionary> SdkRegistry::lookup(std::string_view identifier) const {
  std::optional<std::string> path = pathForIdentifier(identifier);
  if (!path) return std::nullopt;
  os::Result<value::Value> file = value::PropertyList::readFile(*path);
  if (!file.ok()) {
    if (file.error().errnum != ENOENT) {
      os::Log::write(kLogWarning, "SDK registry: ignoring " + *path + ": " + file.error().message);
    }
    return std::nullopt;
  }
  const value::Dictionary* dictionary = file.value().asDictionary();
  if (!dictionary) {
    os::Log::write(kLogWarning, "SDK registry: ignoring " + *path + ": not a dictionary");
    return std::nullopt;
  }
  return *dictionary;
}

value::Dictionary SdkRegistry::resolve(const value::Dictionary& info) const {
  const value::Value* plugIn = info.find("QSExtension");
  const value::Dictionary* plugInDictionary = plugIn ? plugIn->asDictionary() : nullptr;
  if (!plugInDictionary) {
    os::Log::write(kLogNotice, "SDK registry: no \"QSExtension\" dictionary to resolve");
    return info;
  }
  const value::Value* point = plugInDictionary->find("QSExtensionPointIdentifier");
  if (!point) return canonicalize(info);
  const std::string* name = point->asString();
  if (!name) {
    os::Log::write(kLogNotice, "invalid SDK key:" + point->description());
    return info;
  }
  std::optional<value::Dictionary> sdk = lookup(*name);
  if (!sdk) {
    os::Log::write(kLogNotice, "plug-in sdk \"" + *name + "\" not registered");
    return canonicalize(info);
  }
  return canonicalize(mergeDictionary(*sdk, info));
}

}  // namespace sdk
