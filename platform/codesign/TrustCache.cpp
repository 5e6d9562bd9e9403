#include "platform/codesign/TrustCache.h"

#include "platform/os/Log.h"

namespace codesign {

TrustCache::TrustCache(std::string root)
    : root_(std::move(root)),
      watch_(TrustStore::directory(root_), "trust store",
             "trusted keys are read again for every registry read") {
  std::lock_guard lock(mutex_);
  load();
}

std::uint64_t TrustCache::refresh() {
  std::lock_guard lock(mutex_);
  if (watch_.changed()) {
    load();
    ++generation_;
  }
  return generation_;
}

std::shared_ptr<const TrustStore> TrustCache::store() {
  std::lock_guard lock(mutex_);
  return store_;
}

void TrustCache::load() {
  os::Result<TrustStore> loaded = TrustStore::load(root_);
  if (!loaded.ok()) os::Log::write(4, "trust store: " + loaded.error().message);
  store_ =
      std::make_shared<const TrustStore>(loaded.ok() ? std::move(loaded).value() : TrustStore());
}

}  // namespace codesign
