#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/os/Error.h"
#include "platform/sdk/SdkRegistry.h"
#include "platform/value/Dictionary.h"

namespace sdk {

// The SDK dictionaries of one device root (SdkRegistry), each file read at its first use and kept
// until the SDK directory "<root>/System/Library/SDKs" changes. One inotify descriptor
// (close-on-exec, non-blocking) watches that directory, or its nearest existing ancestor while
// it is missing, so that one made later is noticed too. The kernel queues an event before the
// writer's write, rename or unlink returns, so a refresh() after that returns sees the change;
// refresh() costs one read() when nothing changed. When nothing can be watched (no inotify, no
// watch left) the failure is logged once, nothing is kept and every refresh() counts as a change,
// which stays correct, only slower.
//
// Safe for concurrent use from any thread: one mutex guards the descriptor, the generation and
// the kept dictionaries. The dictionaries handed out are immutable values.
class SdkCache {
 public:
  // Starts watching the SDK directory of the device root |root| (a directory path).
  explicit SdkCache(std::string root);
  ~SdkCache();
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
  // Watches the SDK directory, else its nearest existing ancestor, in place of the current
  // watch; fails with the error of the last directory tried. Runs under mutex_.
  os::Status watch();
  // Whether the event |mask| on |name| of the watch |wd| means that the SDKs may have changed,
  // and whether the watch must be set again (the watched directory went away, or the missing one
  // may be there now).
  void classify(int wd, std::uint32_t mask, std::string_view name, bool& changed,
                bool& rewatch) const;
  // Stops watching for good, with a log line saying why. Runs under mutex_.
  void giveUp(const std::string& why);
  // The SDK dictionary of |point|: the kept one, else read now (and kept while watching).
  std::optional<value::Dictionary> sdkFor(const std::string& point);

  const SdkRegistry files_;
  const std::string directory_;
  std::mutex mutex_;
  int fd_ = -1;
  int watch_ = -1;
  // While an ancestor is watched: the name in it that leads to the SDK directory.
  std::string nextName_;
  std::uint64_t generation_ = 0;
  std::map<std::string, std::optional<value::Dictionary>, std::less<>> kept_;
};

}  // namespace sdk
