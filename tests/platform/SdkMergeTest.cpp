#include <gtest/gtest.h>

#include <tuple>
#include <vector>

#include "platform/sdk/SdkMerge.h"

namespace {

using value::Dictionary;
using value::Value;

Value str(const char* text) {
  return Value::string(text);
}

Value num(std::int64_t n) {
  return Value::integer(n);
}

Value dict(Dictionary entries) {
  return Value::dictionary(std::move(entries));
}

Value list(value::Array elements) {
  return Value::array(std::move(elements));
}

TEST(SdkMergeTest, KeysOfOneSideAreKeptWholeAndTheManifestWinsTheRest) {
  Dictionary nested{{"deep", dict({{"k", num(1)}})}, {"Shared", str("only-sdk")}};
  Dictionary sdkSide{{"Extra", dict(nested)},
                     {"Both", num(1)},
                     {"cleantimeout", num(1)},
                     {"Flat", dict({{"a", num(1)}})}};
  Dictionary manifestSide{
      {"Both", num(2)}, {"Mine", str("m")}, {"cleantimeout", num(2)}, {"Flat", str("flat")}};
  Dictionary expected{{"Extra", dict(nested)},  // copied whole, "Shared" string untouched
                      {"Both", num(2)},
                      {"Mine", str("m")},
                      {"cleantimeout", num(2)},  // the override is case-sensitive
                      {"Flat", str("flat")}};
  EXPECT_EQ(sdk::mergeDictionary(sdkSide, manifestSide), expected);
}

TEST(SdkMergeTest, RulesApplyAtEveryDepth) {
  Dictionary sdkSide{{"L1", dict({{"L2", dict({{"CleanTimeout", num(1)}, {"s", num(1)}})}})}};
  Dictionary manifestSide{{"L1", dict({{"L2", dict({{"CleanTimeout", num(2)}, {"s", num(2)}})}})}};
  Dictionary merged = sdk::mergeDictionary(sdkSide, manifestSide);
  EXPECT_EQ(*merged.find("L1"), dict({{"L2", dict({{"CleanTimeout", num(1)}, {"s", num(2)}})}}));
}

// A union without repeats, the SDK's first; single strings count as lists, other values as none.
TEST(SdkMergeTest, SharedResourcesAreAUnionInSdkOrder) {
  const std::vector<std::tuple<Value, Value, Value>> cases = {
      {list({str("a"), str("b"), str("a")}), list({str("c"), str("b"), num(3)}),
       list({str("a"), str("b"), str("c"), num(3)})},
      {str("x"), str("y"), list({str("x"), str("y")})},
      {num(7), dict({}), list({})},
  };
  for (const auto& [sdkSide, manifestSide, expected] : cases) {
    SCOPED_TRACE(sdkSide.description() + " + " + manifestSide.description());
    EXPECT_EQ(sdk::mergeSharedResources(sdkSide, manifestSide), expected);
    Dictionary merged = sdk::mergeDictionary({{"Shared", sdkSide}}, {{"Shared", manifestSide}});
    EXPECT_EQ(*merged.find("Shared"), expected);
  }
}

// The version comes from the attributes, else the bundle's version string, else "1".
TEST(SdkMergeTest, CanonicalizeFillsTheVersionAndTheAttributes) {
  const std::vector<std::tuple<Value, Value, Value>> cases = {
      {dict({{"k", num(1)}}), num(2), dict({{"k", num(1)}, {"QSExtensionVersion", str("1")}})},
      {dict({{"QSExtensionVersion", str("3")}}), str("2.1"),
       dict({{"QSExtensionVersion", str("3")}})},
      {str("not a dictionary"), str("2.1"), dict({{"QSExtensionVersion", str("2.1")}})},
  };
  for (const auto& [given, bundleVersion, expected] : cases) {
    SCOPED_TRACE(given.description());
    Dictionary plugIn{{"Other", num(4)}, {"QSExtensionAttributes", given}};
    Dictionary info{{"QSExtension", dict(plugIn)}, {"QFBundleShortVersionString", bundleVersion}};
    Dictionary canonical = sdk::canonicalize(info);
    EXPECT_EQ(*canonical.find("QSExtension"), dict(plugIn.with("QSExtensionAttributes", expected)));
    EXPECT_EQ(canonical.without("QSExtension"), info.without("QSExtension"));
  }
  // Without a plug-in dictionary there is nothing to complete.
  Dictionary noPlugIn{{"QSExtension", str("wrong")}, {"QFBundleShortVersionString", str("2")}};
  EXPECT_EQ(sdk::canonicalize(noPlugIn), noPlugIn);
}

}  // namespace
