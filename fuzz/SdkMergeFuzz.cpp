// Merges two property-list dictionaries (an SDK side and a manifest side, the input split at a
// "%%" line) with sdk::mergeDictionary and canonicalizes the result. The merge keeps every key of
// both sides, and merging with an empty side changes nothing. Seeds: fuzz/corpus/sdk/.

#include <cstdint>
#include <cstdlib>
#include <span>

#include "FuzzInput.h"
#include "platform/sdk/SdkMerge.h"

namespace {

bool holdsEveryKey(const value::Dictionary& merged, const value::Dictionary& side) {
  for (const auto& [key, value] : side) {
    if (!merged.find(key)) return false;
  }
  return true;
}

bool same(const value::Dictionary& a, const value::Dictionary& b) {
  return fuzz::sameValue(value::Value::dictionary(a), value::Value::dictionary(b));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto [sdkBytes, manifestBytes] = fuzz::splitInput(std::span(data, size));
  auto sdkSide = fuzz::readDictionary(sdkBytes);
  if (!sdkSide) return 0;
  auto manifestSide = fuzz::readDictionary(manifestBytes).value_or(value::Dictionary());
  value::Dictionary merged = sdk::mergeDictionary(*sdkSide, manifestSide);
  if (!holdsEveryKey(merged, *sdkSide) || !holdsEveryKey(merged, manifestSide)) std::abort();
  if (!same(sdk::mergeDictionary(*sdkSide, {}), *sdkSide)) std::abort();
  if (!same(sdk::mergeDictionary({}, manifestSide), manifestSide)) std::abort();
  value::Dictionary canonical = sdk::canonicalize(merged);
  if (const value::Value* version = canonical.find("QFBundleShortVersionString")) {
    sdk::versionText(*version);
  }
  return 0;
}
