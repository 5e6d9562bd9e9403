#pragma once

#include <cstdint>
#include <memory>
#include <string>

#include "platform/codesign/TrustCache.h"
#include "platform/sdk/SdkCache.h"

namespace registrum {

// What the registry judges a plug-in row by when it reads it, beyond the row itself: the SDK
// dictionaries its plug-in dictionary is resolved against, and the trusted signing keys that
// decide whether its entitlements count. Shared by the stores of one workspace; safe from any
// thread.
class Sources {
 public:
  // The sources of the device root |root| (a directory path).
  explicit Sources(const std::string& root)
      : sdks_(std::make_shared<sdk::SdkCache>(root)),
        trust_(std::make_shared<codesign::TrustCache>(root)) {}

  // Takes the changes of both since the last call; returns the generation, which grows with
  // every call that found a change of either (SdkCache::refresh, TrustCache::refresh).
  std::uint64_t refresh() { return sdks_->refresh() + trust_->refresh(); }

  sdk::SdkCache& sdks() { return *sdks_; }
  codesign::TrustCache& trust() { return *trust_; }

 private:
  const std::shared_ptr<sdk::SdkCache> sdks_;
  const std::shared_ptr<codesign::TrustCache> trust_;
};

}  // namespace registrum
