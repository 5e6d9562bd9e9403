#include <gtest/gtest.h>

#include "platform/sdk/SdkRegistry.h"
#include "tests/platform/RegistryFixture.h"
#include "tests/platform/ScopedEnvironment.h"

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

TEST_F(SdkRegistryTest, ReadsEitherEncoding) {
  root_.writePlist("System/Library/SDKs/com.example.xml.plist", Value::dictionary(kSdk));
  root_.writePlist("System/Library/SDKs/com.example.bin.plist", Value::dictionary(kSdk), true);
  EXPECT_EQ(registry_.lookup("com.example.xml"), kSdk);
  EXPECT_EQ(registry_.lookup("com.example.bin"), kSdk);
}

TEST_F(SdkRegistryTest, MissingBrokenAndRefusedAreNothing) {
  root_.writeFile("System/Library/SDKs/broken.plist", "<plist><dict>");
  root_.writePlist("System/Library/SDKs/array.plist", Value::array({}));
  root_.writePlist("System/Library/SDKs/.hidden.plist", Value::dictionary(kSdk));
  root_.writePlist("System/Library/SDKs/a/b.plist", Value::dictionary(kSdk));
  EXPECT_FALSE(registry_.lookup("absent"));
  EXPECT_FALSE(registry_.lookup("broken"));
  EXPECT_FALSE(registry_.lookup("array"));
  EXPECT_FALSE(registry_.lookup(".hidden"));
  EXPECT_FALSE(registry_.lookup("a/b"));
  EXPECT_FALSE(registry_.lookup(""));
  EXPECT_FALSE(registry_.lookup(std::string_view("a\0b", 3)));
  EXPECT_FALSE(registry_.pathForIdentifier("../x"));
  EXPECT_EQ(registry_.pathForIdentifier("x.y"), root_ / "System/Library/SDKs/x.y.plist");
}

TEST_F(SdkRegistryTest, SharedRegistryFollowsTheDeviceRoot) {
  root_.writePlist("System/Library/SDKs/com.example.env.plist", Value::dictionary(kSdk));
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root_.root() + "/");
  EXPECT_EQ(sdk::SdkRegistry::shared().lookup("com.example.env"), kSdk);
}

Dictionary infoFor(Value point) {
  return {{"QFBundleShortVersionString", Value::string("2.0")},
          {"QSExtension", Value::dictionary({{"QSExtensionPointIdentifier", point},
                                             {"CleanTimeout", Value::integer(7)}})}};
}

TEST_F(SdkRegistryTest, ResolveMergesTheSdkThenFillsDefaults) {
  root_.writePlist("System/Library/SDKs/com.example.point.plist", Value::dictionary(kSdk));
  Dictionary resolved = registry_.resolve(infoFor(Value::string("com.example.point")));
  const Dictionary& plugIn = *resolved.find("QSExtension")->asDictionary();
  EXPECT_EQ(*plugIn.find("QSExtensionProtocol"), Value::string("Proto"));
  EXPECT_EQ(*plugIn.find("CleanTimeout"), Value::integer(5));
  EXPECT_EQ(*plugIn.find("QSExtensionAttributes"),
            Value::dictionary({{"QSExtensionVersion", Value::string("2.0")}}));
}

TEST_F(SdkRegistryTest, ResolveWithoutSdkOnlyCanonicalizes) {
  Dictionary resolved = registry_.resolve(infoFor(Value::string("com.example.unknown")));
  const Dictionary& plugIn = *resolved.find("QSExtension")->asDictionary();
  EXPECT_FALSE(plugIn.find("QSExtensionProtocol"));
  EXPECT_EQ(*plugIn.find("CleanTimeout"), Value::integer(7));
  EXPECT_TRUE(plugIn.find("QSExtensionAttributes"));
}

TEST_F(SdkRegistryTest, ResolveLeavesANonStringExtensionPointAlone) {
  Dictionary info = infoFor(Value::integer(3));
  EXPECT_EQ(registry_.resolve(info), info);
}

}  // namespace
