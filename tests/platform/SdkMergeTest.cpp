#include <gtest/gtest.h>

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

TEST(SdkMergeTest, MergeExampleGivesStatedResult) {
  Dictionary sdkSide{
      {"QSExtension", dict({{"QSExtensionAttributes", dict({{"a", num(1)}, {"b", num(2)}})},
                            {"CleanTimeout", num(5)},
                            {"Shared", list({str("x")})}})}};
  Dictionary manifestSide{{"QSExtension", dict({{"QSExtensionAttributes", dict({{"a", num(9)}})},
                                                {"CleanTimeout", num(7)},
                                                {"Shared", list({str("y")})}})}};
  Dictionary expected{
      {"QSExtension", dict({{"QSExtensionAttributes", dict({{"a", num(9)}, {"b", num(2)}})},
                            {"CleanTimeout", num(5)},
                            {"Shared", list({str("x"), str("y")})}})}};
  EXPECT_EQ(sdk::mergeDictionary(sdkSide, manifestSide), expected);
}

TEST(SdkMergeTest, KeysOfOneSideAreKeptWhole) {
  Dictionary nested{{"deep", dict({{"k", num(1)}})}, {"Shared", str("only-sdk")}};
  Dictionary sdkSide{{"Extra", dict(nested)}, {"Both", num(1)}};
  Dictionary manifestSide{{"Both", num(2)}, {"Mine", str("m")}};
  Dictionary merged = sdk::mergeDictionary(sdkSide, manifestSide);
  EXPECT_EQ(*merged.find("Extra"), dict(nested));  // copied whole, "Shared" string untouched
  EXPECT_EQ(*merged.find("Both"), num(2));
  EXPECT_EQ(*merged.find("Mine"), str("m"));
  EXPECT_EQ(merged.size(), 3u);
}

TEST(SdkMergeTest, RulesApplyAtEveryDepthAndNeverChangeInputs) {
  Dictionary sdkSide{{"L1", dict({{"L2", dict({{"CleanTimeout", num(1)}, {"s", num(1)}})}})}};
  Dictionary manifestSide{{"L1", dict({{"L2", dict({{"CleanTimeout", num(2)}, {"s", num(2)}})}})}};
  Dictionary sdkCopy = sdkSide;
  Dictionary manifestCopy = manifestSide;
  Dictionary merged = sdk::mergeDictionary(sdkSide, manifestSide);
  EXPECT_EQ(*merged.find("L1"), dict({{"L2", dict({{"CleanTimeout", num(1)}, {"s", num(2)}})}}));
  EXPECT_EQ(sdkSide, sdkCopy);
  EXPECT_EQ(manifestSide, manifestCopy);
}

TEST(SdkMergeTest, ManifestNonDictionaryBeatsSdkDictionary) {
  Dictionary merged = sdk::mergeDictionary({{"K", dict({{"a", num(1)}})}}, {{"K", str("flat")}});
  EXPECT_EQ(*merged.find("K"), str("flat"));
}

TEST(SdkMergeTest, OnlyCleanTimeoutIsOverridden) {
  EXPECT_TRUE(sdk::sdkOverridesKey("CleanTimeout"));
  EXPECT_FALSE(sdk::sdkOverridesKey("cleantimeout"));
  EXPECT_FALSE(sdk::sdkOverridesKey("Shared"));
  EXPECT_FALSE(sdk::sdkOverridesKey(""));
}

TEST(SdkMergeTest, SharedResourcesUnionKeepsSdkOrderFirst) {
  Value merged = sdk::mergeSharedResources(list({str("a"), str("b"), str("a")}),
                                           list({str("c"), str("b"), num(3)}));
  EXPECT_EQ(merged, list({str("a"), str("b"), str("c"), num(3)}));
}

TEST(SdkMergeTest, SharedResourcesAcceptSingleStringsAndIgnoreOtherValues) {
  EXPECT_EQ(sdk::mergeSharedResources(str("x"), str("y")), list({str("x"), str("y")}));
  EXPECT_EQ(sdk::mergeSharedResources(str("x"), str("x")), list({str("x")}));
  EXPECT_EQ(sdk::mergeSharedResources(num(7), list({str("y")})), list({str("y")}));
  EXPECT_EQ(sdk::mergeSharedResources(Value(), dict({})), list({}));
  Dictionary merged = sdk::mergeDictionary({{"Shared", str("x")}}, {{"Shared", str("y")}});
  EXPECT_EQ(*merged.find("Shared"), list({str("x"), str("y")}));
}

Dictionary plugInInfo(Dictionary plugIn, std::optional<Value> bundleVersion) {
  Dictionary info{{"QSExtension", dict(std::move(plugIn))}};
  if (bundleVersion) info = info.with("QFBundleShortVersionString", *bundleVersion);
  return info;
}

Value versionOf(const Dictionary& info) {
  const Value* attributes = info.find("QSExtension")->asDictionary()->find("QSExtensionAttributes");
  const Value* version = attributes->asDictionary()->find("QSExtensionVersion");
  return version ? *version : Value();
}

TEST(SdkMergeTest, CanonicalizeFillsTheVersion) {
  Dictionary withAttributes{{"QSExtensionAttributes", dict({{"k", num(1)}})}};
  EXPECT_EQ(versionOf(sdk::canonicalize(plugInInfo(withAttributes, str("2.1")))), str("2.1"));
  EXPECT_EQ(versionOf(sdk::canonicalize(plugInInfo(withAttributes, std::nullopt))), str("1"));
  EXPECT_EQ(versionOf(sdk::canonicalize(plugInInfo(withAttributes, num(2)))), str("1"));
  Dictionary ownVersion{{"QSExtensionAttributes", dict({{"QSExtensionVersion", str("3")}})}};
  EXPECT_EQ(versionOf(sdk::canonicalize(plugInInfo(ownVersion, str("2.1")))), str("3"));
}

TEST(SdkMergeTest, CanonicalizeMakesMissingOrMistypedAttributesEmpty) {
  for (const Dictionary& plugIn :
       {Dictionary{}, Dictionary{{"QSExtensionAttributes", str("not a dictionary")}}}) {
    Dictionary info = sdk::canonicalize(plugInInfo(plugIn, std::nullopt));
    const Value* attributes =
        info.find("QSExtension")->asDictionary()->find("QSExtensionAttributes");
    EXPECT_EQ(*attributes, dict({{"QSExtensionVersion", str("1")}}));
  }
}

TEST(SdkMergeTest, CanonicalizeLeavesInfoWithoutPlugInDictionaryAlone) {
  Dictionary info{{"QSExtension", str("wrong")}, {"QFBundleShortVersionString", str("2")}};
  EXPECT_EQ(sdk::canonicalize(info), info);
  EXPECT_EQ(sdk::canonicalize(Dictionary()), Dictionary());
}

}  // namespace
