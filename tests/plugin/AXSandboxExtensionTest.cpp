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

// One grant per object, however often it is consumed, held until expelled or destroyed.
TEST_F(AXSandboxExtensionTest, HoldsOneGrantFromItsFirstGoodConsumeUntilExpelledOrDestroyed) {
  std::int64_t handle = 0;
  {
    AXSandboxExtension extension(token_);
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

  AXSandboxExtension expelled(token_);
  ASSERT_TRUE(expelled.consume().ok());
  expelled.expel();
  EXPECT_EQ(expelled.handle(), 0);
  EXPECT_EQ(GrantTable::shared().size(), held_);
  expelled.setHandle(1 << 30);  // an unknown handle is forgotten all the same
  expelled.expel();
  EXPECT_EQ(expelled.handle(), 0);

  // A refused token leaves the object unconsumed, ready for another.
  AXSandboxExtension refused("v1;not a token");
  os::Status status = refused.consume();
  ASSERT_FALSE(status.ok());
  EXPECT_EQ(status.error().errnum, EINVAL);
  EXPECT_EQ(refused.handle(), 0);
  refused.setToken(token_);
  ASSERT_TRUE(refused.consume().ok());
  EXPECT_NE(refused.handle(), 0);
}

}  // namespace
