// Ordering and the death of clients, with the service queue parked on a latch so that the order
// of events is known.

#include <gtest/gtest.h>
#include <unistd.h>

#include <future>

#include "tests/axd/InProcessServer.h"
#include "tests/e2e/RawClient.h"

namespace {

using value::Value;

Value bulk(std::uint64_t flags) {
  return Value::dictionary({{"request", Value::string("bulk")},
                            {"version", Value::unsignedInteger(3)},
                            {"flags", Value::unsignedInteger(flags)}});
}

// Holds the service queue until release() or destruction.
class ParkedServiceQueue {
 public:
  ParkedServiceQueue() {
    InProcessServer::server()->submitWork(
        [released = released_.get_future().share()] { released.wait(); });
  }
  ~ParkedServiceQueue() { release(); }
  void release() {
    if (!done_) released_.set_value();
    done_ = true;
  }

 private:
  std::promise<void> released_;
  bool done_ = false;
};

// Sends a bulk request with |flags| and waits until the daemon has submitted it.
void submit(RawClient& client, std::uint64_t id, std::uint64_t flags) {
  std::string seen = "\"flags\": " + std::to_string(flags) + ",";
  std::size_t before = InProcessServer::occurrences(seen);
  client.sendFrame(zyn::FrameKind::Request, id, bulk(flags));
  ASSERT_TRUE(InProcessServer::waitForLog(seen, before + 1));
}

TEST(ServerTest, TheSharedServerIsTheOneBuilt) {
  EXPECT_EQ(AXDServer::server(), InProcessServer::server());
}

TEST(ServerTest, RequestsOfAllClientsRunOneAtATimeInSubmissionOrder) {
  RawClient a(InProcessServer::socketPath());
  RawClient b(InProcessServer::socketPath());
  {
    ParkedServiceQueue parked;
    submit(a, 1, 0xa1);
    submit(b, 1, 0xb1);
    submit(a, 2, 0xa2);
  }
  EXPECT_EQ(a.receive()->id, 1u);
  EXPECT_EQ(a.receive()->id, 2u);
  EXPECT_EQ(b.receive()->id, 1u);
  std::string log = InProcessServer::log();
  std::size_t a1 = log.find("bulk options 0xa1");
  std::size_t b1 = log.find("bulk options 0xb1");
  std::size_t a2 = log.find("bulk options 0xa2");
  ASSERT_NE(a2, std::string::npos);
  EXPECT_LT(a1, b1);
  EXPECT_LT(b1, a2);
}

TEST(ServerTest, ADeadClientsQueuedRequestsAreDroppedAndOthersServed) {
  std::size_t deaths = InProcessServer::occurrences(" is dead");
  {
    ParkedServiceQueue parked;
    RawClient dying(InProcessServer::socketPath());
    submit(dying, 1, 0xd1);
    submit(dying, 2, 0xd2);
    dying.close();
    ASSERT_TRUE(InProcessServer::waitForLog(" is dead", deaths + 1));
  }
  RawClient other(InProcessServer::socketPath());
  other.sendFrame(zyn::FrameKind::Request, 7, bulk(0xe1));
  auto reply = other.receive();
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->id, 7u);
  std::string log = InProcessServer::log();
  EXPECT_EQ(log.find("bulk options 0xd1"), std::string::npos);
  EXPECT_EQ(log.find("bulk options 0xd2"), std::string::npos);
  EXPECT_NE(log.find("bulk options 0xe1"), std::string::npos);
}

}  // namespace
