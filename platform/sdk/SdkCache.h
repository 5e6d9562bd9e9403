#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/os/DirectoryWatch.h"
#include "platform/os/Error.h"
#include "platform/sdk/SdkRegistry.h"
#include "platform/value/Dictionary.h"

namespace sdk {

// The SDK dictionaries of one device root (SdkRegistry), each file read at its first use and kept
// until the SDK directory "<root>/System/Library/SDKs" changes (os::DirectoryWatch: a refresh()
// after a writer returned sees its change; one read() when nothing changed; when the directory
// cannot be watched nothing is kept and every refresh() counts as a change).
//
// Safe for concurrent use from any thread: one mutex guards the generation and the kept
// dictionaries. The dictionaries handed out are immutable values.
class SdkCache {
 public:
  // Starts watching the SDK directory of the device root |root| (a directory path).
  explicit SdkCache(std::string root);
  SdkCache(const SdkCache&) = delete;
  SdkCache& operator=(const SdkCache&) = delete;

  // Takes the changes queued since the last call; when there were any, drops every kept
  // dictionary and counts a new generation. Returns the generation: 0 until the first change,
  // then one more for each call that found changes, so a caller that keeps something built from
  // resolved manifests drops it when the generation it saw last has grown.
  std::uint64_t refresh();

  // |info| (a bundle's Info.plist) with the SDK dictionary of its extension point
  // ("QSExtension"."QSExtensionPointIdentifier", as kept since the last refresh()) merged under it
  // by mergeDictionary, then canonicalized (SdkMerge.h). Without an extension point, or without
  // an SDK for it, |info| is only canonicalized; a non-string extension point or a "QSExtension"
  // that is no dictionary leaves |info| unchanged. Never fails; logs only when it reads a file:
  // an unregistered extension point ("plug-in sdk "P" not registered") or a broken file.
  value::Dictionary resolve(const value::Dictionary& info);

 private:
  // The SDK dictionary of |point|: the kept one, else read now (and kept while watching).
  std::optional<value::Dictionary> sdkFor(const std::string& point);

  const SdkRegistry files_;
  os::DirectoryWatch watch_;
  std::mutex mutex_;
  std::uint64_t generation_ = 0;
  std::map<std::string, std::optional<value::Dictionary>, std::less<>> kept_;
};

}  // namespace sdk
