// The server's holds: what they cover, release by token, and release when their client dies.

#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "axd/AXDNames.h"
#include "platform/notify/Notification.h"
#include "platform/os/OpenWork.h"
#include "platform/value/PropertyList.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/PlugInShelf.h"
#include "tests/axd/SelfClient.h"
#include "tests/support/BlockingClient.h"

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
    auto made = std::make_shared<AXDPlugInHold>(plugIns, client);
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

// The identifiers of the plug-ins with |ids| that a match request with |flags| returns, in order.
std::vector<std::string> discovered(BlockingClient& client, const std::vector<std::string>& ids,
                                    std::uint64_t flags) {
  value::Array names;
  for (const std::string& id : ids) names.push_back(value::Value::string(id));
  AXDaemonClient::Request request = client.client().request(AXProtocol::kMatch);
  request[AXProtocol::kRules] =
      value::Value::dictionary({{"QSExtensionIdentifier", value::Value::array(names)}});
  request[AXProtocol::kFlags] = value::Value::unsignedInteger(flags);
  auto pending = client.start(request);
  auto reply = BlockingClient::await(pending);
  const value::Value* body = reply ? std::get_if<value::Value>(&*reply) : nullptr;
  const value::Value* matches =
      body && body->asDictionary() ? body->asDictionary()->find(AXProtocol::kMatches) : nullptr;
  std::optional<value::Value> list =
      matches ? client.client().convertFromZyn(*matches) : std::nullopt;
  std::vector<std::string> found;
  if (!list || !list->asArray()) return {"no matches: " + BlockingClient::describe(reply)};
  for (const value::Value& form : *list->asArray()) {
    found.push_back(*form.asDictionary()->find("identifier")->asString());
  }
  return found;
}

TEST_F(AXDServerHoldTest, DiscoveryLeavesOutAHeldPlugInUnlessAManagerDiscoversAll) {
  auto held = plugIn("hold.hidden");
  plugIn("hold.open");
  const std::string grants =
      InProcessServer::shared().root() + "/etc/annexa/entitlements.d/0-holds.plist";
  std::filesystem::create_directories(std::filesystem::path(grants).parent_path());
  std::ofstream(grants)
      << value::PropertyList::toXml(
             value::Value::dictionary(
                 {{"Executable",
                   value::Value::string(std::filesystem::canonical("/proc/self/exe"))},
                  {"Entitlements", value::Value::dictionary({{AXDNames::kManagerEntitlement,
                                                              value::Value::boolean(true)}})}}))
             .value();
  std::filesystem::permissions(grants, std::filesystem::perms(0644));
  BlockingClient client(InProcessServer::kServiceName);
  const std::vector<std::string> both = {"hold.hidden", "hold.open"};

  auto placed = hold({held});
  EXPECT_EQ(discovered(client, both, 0), std::vector<std::string>{"hold.open"});
  EXPECT_EQ(discovered(client, both, AXProtocol::AXDiscoverAll), both);
  server_->unholdToken(placed->uuid());
  EXPECT_EQ(discovered(client, both, 0), both);
  std::filesystem::remove(grants);
}

}  // namespace
