#include <gtest/gtest.h>

#include <cerrno>

#include "Annexa/AXSandboxExtension.h"
#include "platform/sandbox/GrantTable.h"
#include "tests/plugin/DeviceRoot.h"

namespace {

using sandbox::GrantTable;

class AXSandboxExtensionTest : public DeviceRootTest {
 protected:
  void SetUp() override {
    DeviceRootTest::SetUp();
    file_ = root_.write("file.txt", "contents");
    os::Result<std::string> issued = AXSandboxIssueReadExtension(AXFileURL(file_));
    ASSERT_TRUE(issued.ok()) << issued.error().message;
    token_ = issued.value();
    held_ = GrantTable::shared().size();
  }

  std::string file_;
  std::string token_;
  std::size_t held_ = 0;
};

// One grant per object, however often it is consumed, held until the object goes.
TEST_F(AXSandboxExtensionTest, ConsumingTwiceConsumesOnceAndDestructionExpels) {
  std::int64_t handle = 0;
  {
    AXSandboxExtension extension(token_);
    EXPECT_EQ(extension.handle(), 0);
    ASSERT_TRUE(extension.consume().ok());
    handle = extension.handle();
    EXPECT_NE(handle, 0);
    ASSERT_TRUE(extension.consume().ok());
    EXPECT_EQ(extension.handle(), handle);
    EXPECT_EQ(GrantTable::shared().size(), held_ + 1);

    AXSandboxExtension fresh(token_);
    fresh.expel();  // holds nothing, so releases nothing
    EXPECT_TRUE(GrantTable::shared().find(handle));
  }
  EXPECT_FALSE(GrantTable::shared().find(handle));
  EXPECT_EQ(GrantTable::shared().size(), held_);
}

TEST_F(AXSandboxExtensionTest, ExpelReleasesTheGrantAndDropsEvenAnUnknownHandle) {
  AXSandboxExtension extension(token_);
  ASSERT_TRUE(extension.consume().ok());
  extension.expel();
  EXPECT_EQ(extension.handle(), 0);
  EXPECT_EQ(GrantTable::shared().size(), held_);
  extension.setHandle(1 << 30);
  extension.expel();
  EXPECT_EQ(extension.handle(), 0);
}

TEST_F(AXSandboxExtensionTest, ARefusedTokenCountsAsNotConsumed) {
  AXSandboxExtension extension("v1;not a token");
  os::Status refused = extension.consume();
  ASSERT_FALSE(refused.ok());
  EXPECT_EQ(refused.error().errnum, EINVAL);
  EXPECT_EQ(extension.handle(), 0);
  EXPECT_EQ(GrantTable::shared().size(), held_);

  extension.setToken(token_);
  ASSERT_TRUE(extension.consume().ok());
  EXPECT_NE(extension.handle(), 0);
}

}  // namespace
