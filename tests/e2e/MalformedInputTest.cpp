// What clients may send that the client library never would: broken frames, messages that are
// no requests, and connections that end or say goodbye. The daemon must survive all of it.

#include <cstdint>
#include <random>
#include <span>
#include <string>
#include <vector>

#include "platform/zyn/Frame.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/support/BlockingClient.h"

namespace {

using value::Value;
using zyn::FrameKind;

// A frame's 13 header bytes, written by hand so that they can lie.
std::vector<std::uint8_t> header(std::uint32_t length, std::uint8_t kind, std::uint64_t id) {
  std::vector<std::uint8_t> bytes;
  for (int shift = 24; shift >= 0; shift -= 8) bytes.push_back(length >> shift);
  bytes.push_back(kind);
  for (int shift = 56; shift >= 0; shift -= 8) bytes.push_back(id >> shift);
  return bytes;
}

std::vector<std::uint8_t> encoded(FrameKind kind, std::uint64_t id, const Value& body) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(zyn::Frame{kind, id, body}, bytes);
  return bytes;
}

// A bulk request that carries |depth| arrays inside one another, so that its item nests
// |depth| + 1 levels deep.
Value bulkNesting(int depth) {
  Value nested = Value::unsignedInteger(0);
  for (int i = 0; i < depth; ++i) nested = Value::array({nested});
  return Value::dictionary(RawClient::bulkRequest(0).asDictionary()->with("nested", nested));
}

TEST_F(DaemonTest, ABrokenFrameClosesOnlyItsOwnConnection) {
  ASSERT_TRUE(start());
  std::vector<std::uint8_t> truncated = header(9 + 5, 1, 1);
  truncated.insert(truncated.end(), {0xa1, 0x67, 'r', 'e', 'q'});  // {"request"... cut short
  std::vector<std::uint8_t> unknownKind = encoded(FrameKind::Request, 1, RawClient::bulkRequest(0));
  unknownKind[4] = 9;
  std::mt19937 random(20240611);  // fixed: the same garbage every run
  std::vector<std::uint8_t> garbage(4096);
  for (auto& byte : garbage) byte = static_cast<std::uint8_t>(random());
  const std::vector<std::pair<std::string, std::vector<std::uint8_t>>> cases = {
      {"length over 64 MiB", header((64u << 20) + 1, 1, 1)},
      {"length under the header's 9 bytes", header(8, 1, 1)},
      {"truncated CBOR", truncated},
      {"unknown frame kind", unknownKind},
      {"nesting deeper than 128", encoded(FrameKind::Request, 1, bulkNesting(128))},
      {"random garbage", garbage},
  };
  for (const auto& [name, bytes] : cases) {
    SCOPED_TRACE(name);
    auto raw = connectRaw();
    ASSERT_TRUE(raw);
    ASSERT_TRUE(raw->send(bytes));
    EXPECT_TRUE(raw->closedByPeer());
    expectServing();
  }
  EXPECT_EQ(logCount("closing connection"), cases.size());
  auto deepest = connectRaw();
  ASSERT_TRUE(deepest);
  EXPECT_EQ(deepest->request(1, bulkNesting(127)), "ok");  // one level less is served
}

TEST_F(DaemonTest, MessagesThatAreNoRequestsWithAReplyGetNone) {
  ASSERT_TRUE(start());
  auto raw = connectRaw();
  ASSERT_TRUE(raw);
  Value array = Value::array({Value::unsignedInteger(1), Value::unsignedInteger(2)});
  ASSERT_TRUE(raw->sendFrame(FrameKind::Request, 1, array));
  ASSERT_TRUE(raw->sendFrame(FrameKind::OneWay, 2, RawClient::bulkRequest(0x3a3a)));
  // The next frame the daemon sends must answer request 3: neither message above got a reply.
  EXPECT_EQ(raw->request(3, RawClient::bulkRequest(0)), "ok");
  EXPECT_TRUE(logHasLineWith({"unexpected message [1, 2] on connection"}));
  // The one-way request was worked all the same.
  EXPECT_EQ(logCount("bulk options 0x3a3a not supported"), 1u);
  expectServing();
}

TEST_F(DaemonTest, AClientThatLeavesInTheMiddleOfAFrameDisturbsNoOther) {
  ASSERT_TRUE(start());
  BlockingClient other;
  EXPECT_EQ(other.bulk(1), "ok");
  std::vector<std::uint8_t> frame = encoded(FrameKind::Request, 1, RawClient::bulkRequest(0x4a1f));
  {
    auto leaving = connectRaw();
    ASSERT_TRUE(leaving);
    ASSERT_TRUE(leaving->send(std::span(frame).first(frame.size() / 2)));
    // While the daemon waits for the rest of that frame, others are served.
    EXPECT_EQ(other.bulk(2), "ok");
  }
  EXPECT_EQ(other.bulk(3), "ok");
  expectServing();
  EXPECT_EQ(logCount("bulk options 0x4a1f"), 0u);
}

TEST_F(DaemonTest, AGoodbyeIsLoggedAndTheClientIsStillAnswered) {
  ASSERT_TRUE(start({"-v"}));
  auto raw = connectRaw();
  ASSERT_TRUE(raw);
  ASSERT_TRUE(raw->sendFrame(FrameKind::Control, 0,
                             Value::dictionary({{"control", Value::string("goodbye")}})));
  EXPECT_TRUE(daemon().waitForLog(thisClient() + " termination imminent"));
  EXPECT_EQ(raw->request(1, RawClient::bulkRequest(0)), "ok");
}

}  // namespace
