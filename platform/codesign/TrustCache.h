#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

#include "platform/codesign/TrustStore.h"
#include "platform/os/DirectoryWatch.h"

namespace codesign {

// The trust store of a device root, loaded once and again whenever its directory changes
// (os::DirectoryWatch), so a key added, changed or removed counts from the next refresh. Safe for
// concurrent use from any thread.
class TrustCache {
 public:
  // The cache of the device root |root| (a directory path).
  explicit TrustCache(std::string root);

  // Reloads the store when its directory changed since the last call; returns the generation: 0
  // until the first change, then one more for each call that found one.
  std::uint64_t refresh();
  // The store as of the last refresh (or construction). A store that cannot be listed trusts no
  // key (logged).
  std::shared_ptr<const TrustStore> store();

 private:
  void load();  // under mutex_

  const std::string root_;
  os::DirectoryWatch watch_;
  std::mutex mutex_;
  std::uint64_t generation_ = 0;
  std::shared_ptr<const TrustStore> store_;
};

}  // namespace codesign
