#include <gtest/gtest.h>

#include "platform/sdk/SdkRegistry.h"
#include "tests/platform/RegistryFixture.h"

namespace {

using value::Dictionary;
using value::Value;

const Dictionary kSdk{
    {"QSExtension", Value::dictionary({{"QSExtensionProtocol", Value::string("Proto")},
                                       {"CleanTimeout", Value::integer(5)}})}};

class SdkRegistryTest : public ::testing::Test {
 protected:
  RegistryFixture root_;
  sdk::SdkRegistry registry_{root_.root()};
};

TEST_F(SdkRegistryTest, MissingBrokenAndRefusedAreNothing) {
  root_.writeFile("System/Library/SDKs/broken.plist", "<plist><dict>");
  root_.writePlist("System/Library/SDKs/array.plist", Value::array({}));
  root_.writePlist("System/Library/SDKs/.hidden.plist", Value::dictionary(kSdk));
  root_.writePlist("System/Library/SDKs/a/b.plist", Value::dictionary(kSdk));
  for (std::string_view name :
       {std::string_view("absent"), std::string_view("broken"), std::string_view("array"),
        std::string_view(".hidden"), std::string_view("a/b"), std::string_view(""),
        std::string_view("a\0b", 3)}) {
    EXPECT_FALSE(registry_.lookup(name)) << name;
  }
}

Dictionary infoFor(Value point) {
  return {{"QFBundleShortVersionString", Value::string("2.0")},
          {"QSExtension", Value::dictionary({{"QSExtensionPointIdentifier", point},
                                             {"CleanTimeout", Value::integer(7)}})}};
}

// Without an SDK the manifest is only canonicalized, which WorkspaceTest sees in every record.
TEST_F(SdkRegistryTest, ResolveMergesTheSdkThenFillsDefaults) {
  root_.writePlist("System/Library/SDKs/com.example.point.plist", Value::dictionary(kSdk));
  Dictionary resolved = registry_.resolve(infoFor(Value::string("com.example.point")));
  const Dictionary& plugIn = *resolved.find("QSExtension")->asDictionary();
  EXPECT_EQ(*plugIn.find("QSExtensionProtocol"), Value::string("Proto"));
  EXPECT_EQ(*plugIn.find("CleanTimeout"), Value::integer(5));
  EXPECT_EQ(*plugIn.find("QSExtensionAttributes"),
            Value::dictionary({{"QSExtensionVersion", Value::string("2.0")}}));
  // A non-string extension point leaves the manifest as it is.
  Dictionary info = infoFor(Value::integer(3));
  EXPECT_EQ(registry_.resolve(info), info);
}

}  // namespace
