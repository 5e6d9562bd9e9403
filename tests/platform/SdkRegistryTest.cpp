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
  root_.write("System/Library/SDKs/broken.plist", "<plist><dict>");
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

}  // namespace
