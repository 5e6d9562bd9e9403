#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/sdk/SdkMerge.h"
#include "platform/value/Dictionary.h"

namespace sdk {

// The SDK dictionaries of a device root, one per extension point:
// "<root>/System/Library/SDKs/<extension point identifier>.plist", a property list in any
// encoding holding a dictionary shaped like a bundle's Info.plist. Files are read at every
// lookup, so an SDK installed while a process runs is seen at once (SdkCache keeps them until
// they change). Immutable; safe to use from any thread.
class SdkRegistry {
 public:
  // The registry of the current device root, read from os::Paths::root() at every lookup.
  static const SdkRegistry& shared();

  // The registry of the device root |root| (a directory path).
  explicit SdkRegistry(std::string root);

  // "<root>/System/Library/SDKs", whether or not it exists.
  std::string directory() const;

  // The file of |identifier|'s SDK dictionary, whether or not it exists; nothing for an
  // identifier that can name no file: empty, containing '/' or a NUL byte, or starting with '.'.
  std::optional<std::string> pathForIdentifier(std::string_view identifier) const;

  // The SDK dictionary of the extension point |identifier|. Nothing when there is no such file
  // or the identifier is refused (see pathForIdentifier); a file that exists but cannot be read
  // or holds no dictionary is also nothing, with a log line naming the file and the reason.
  std::optional<value::Dictionary> lookup(std::string_view identifier) const;

 private:
  SdkRegistry() = default;

  std::string rootDirectory() const;

  // Nothing: the current device root, read at every call.
  std::optional<std::string> root_;
};

}  // namespace sdk
