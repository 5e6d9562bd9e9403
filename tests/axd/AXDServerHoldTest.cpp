// The server's holds: what they cover, release by token, and release when their client dies.
// That discovery leaves held plug-ins out is checked end to end.

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "axd/AXDNames.h"
#include "platform/notify/Notification.h"
#include "platform/os/OpenWork.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/PlugInShelf.h"
#include "tests/axd/SelfClient.h"

namespace {

class AXDServerHoldTest : public ::testing::Test {
 protected:
  void SetUp() override {
    server_ = InProcessServer::shared().built();
    ASSERT_TRUE(server_);
    shelf_ = std::make_unique<PlugInShelf>(server_);
    since_ = InProcessServer::shared().logSize();
  }

  std::shared_ptr<AXDPlugIn> plugIn(const std::string& id) {
    return server_->findPlugIn(shelf_->add("Held", id, "test.hold")->uuid());
  }
  std::shared_ptr<AXDPlugInHold> hold(std::vector<std::shared_ptr<AXDPlugIn>> plugIns,
                                      const std::shared_ptr<AXDZynClient>& client = nullptr) {
    auto made = std::make_shared<AXDPlugInHold>(plugIns, std::vector<std::string>{}, client);
    server_->addHold(made);
    return made;
  }
  static std::uint64_t posted() {
    return notify::Notification::count(AXDNames::kAnnotationChangeNotification).value();
  }

  std::shared_ptr<AXDServer> server_;
  std::unique_ptr<PlugInShelf> shelf_;
  std::size_t since_ = 0;
};

TEST_F(AXDServerHoldTest, APlugInStaysHeldUntilEveryHoldOnItIsReleased) {
  auto held = plugIn("hold.twice");
  std::uint64_t before = posted();
  auto first = hold({held, held});
  auto second = hold({held});
  EXPECT_EQ(first->blocked().size(), 1u);
  // Another record of the same plug-in is held too: holds compare records by UUID.
  EXPECT_TRUE(server_->holdOnPlugIn(*AXDPlugIn::initWithRGData(held->rgproxy())));

  server_->unholdToken(first->uuid());
  EXPECT_TRUE(server_->holdOnPlugIn(*held));
  server_->unholdToken(first->uuid());  // a second release of the same token does nothing
  server_->unholdToken(second->uuid());
  EXPECT_FALSE(server_->holdOnPlugIn(*held));
  EXPECT_EQ(posted(), before + 4);  // two adds, two releases
  EXPECT_TRUE(InProcessServer::shared().waitForLog(
      "releasing plug-in hold " + first->uuid().string() + " at client's request", since_));
}

TEST_F(AXDServerHoldTest, ADeadClientReleasesExactlyItsOwnHolds) {
  auto held = plugIn("hold.dead");
  auto other = std::make_unique<SelfClient>();
  auto keeper = hold({held}, other->client());
  std::uint64_t work = os::OpenWork::count();
  std::vector<std::string> tokens;
  pid_t pid = getpid();
  {
    SelfClient dying;
    for (int i = 0; i < 3; ++i) tokens.push_back(hold({held}, dying.client())->uuid().string());
    EXPECT_EQ(os::OpenWork::count(), work + 3);
  }
  for (const std::string& token : tokens) {
    EXPECT_TRUE(InProcessServer::shared().waitForLog(
        "releasing plug-in hold " + token + " for dead client pid " + std::to_string(pid), since_));
  }
  auto holds = server_->holds();
  ASSERT_EQ(holds.size(), 1u);
  EXPECT_EQ(holds[0], keeper);
  EXPECT_TRUE(server_->holdOnPlugIn(*held));
  server_->unholdToken(keeper->uuid());
}

}  // namespace
