#include "platform/sdk/SdkCache.h"

#include "platform/os/Log.h"
#include "platform/sdk/SdkMerge.h"

namespace sdk {

namespace {

constexpr int kLogNotice = 5;

}  // namespace

SdkCache::SdkCache(std::string root)
    : files_(std::move(root)),
      watch_(files_.directory(), "SDK registry", "SDK files are read at every lookup") {}

std::uint64_t SdkCache::refresh() {
  std::lock_guard lock(mutex_);
  if (watch_.changed()) {
    kept_.clear();
    ++generation_;
  }
  return generation_;
}

value::Dictionary SdkCache::resolve(const value::Dictionary& info) {
  const value::Value* plugIn = info.find("QSExtension");
  const value::Dictionary* plugInDictionary = plugIn ? plugIn->asDictionary() : nullptr;
  if (!plugInDictionary) return info;
  const value::Value* point = plugInDictionary->find("QSExtensionPointIdentifier");
  if (!point) return canonicalize(info);
  const std::string* name = point->asString();
  if (!name) return info;
  std::optional<value::Dictionary> sdk = sdkFor(*name);
  return canonicalize(sdk ? mergeDictionary(*sdk, info) : info);
}

std::optional<value::Dictionary> SdkCache::sdkFor(const std::string& point) {
  std::lock_guard lock(mutex_);
  auto kept = kept_.find(point);
  if (kept != kept_.end()) return kept->second;
  std::optional<value::Dictionary> sdk = files_.lookup(point);
  if (!sdk) os::Log::write(kLogNotice, "plug-in sdk \"" + point + "\" not registered");
  if (watch_.watching()) kept_.emplace(point, sdk);
  return sdk;
}

}  // namespace sdk
