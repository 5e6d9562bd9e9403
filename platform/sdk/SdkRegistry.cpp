#include "platform/sdk/SdkRegistry.h"

#include <cerrno>

#include "platform/os/Log.h"
#include "platform/os/Paths.h"
#include "platform/value/PropertyList.h"

namespace sdk {

namespace {

constexpr int kLogWarning = 4;

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

std::string SdkRegistry::directory() const {
  return rootDirectory() + "/System/Library/SDKs";
}

std::optional<std::string> SdkRegistry::pathForIdentifier(std::string_view identifier) const {
  if (identifier.empty() || identifier.front() == '.' ||
      identifier.find_first_of(std::string_view("/\0", 2)) != std::string_view::npos) {
    return std::nullopt;
  }
  return directory() + "/" + std::string(identifier) + ".plist";
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

}  // namespace sdk
