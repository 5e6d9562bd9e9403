// What reaches the daemon over its socket: the request envelope and bulk, and what clients may
// send that the client library never would: broken frames, messages that are no requests, and
// connections that end or say goodbye. The daemon must survive all of it. And, on the client's
// side, clients of one process that never wait for one another.

#include <cstdint>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/zyn/Frame.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using value::Value;
using zyn::FrameKind;

// A request with the given "request" and "version" fields; a field that is nothing is left out.
AXDaemonClient::Request envelope(std::optional<Value> type, std::optional<Value> version) {
  AXDaemonClient::Request request;
  if (type) request[AXProtocol::kRequest] = *type;
  if (version) request[AXProtocol::kVersion] = *version;
  return request;
}

AXDaemonClient::Request envelope(const char* type, std::uint64_t version) {
  return envelope(Value::string(type), Value::unsignedInteger(version));
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

// The version is checked first, then the type: an unusable envelope gets the first error only.
TEST_F(DaemonTest, TheEnvelopeIsCheckedVersionFirstThenTypeAndBulkOnlyLogsItsFlags) {
  ASSERT_TRUE(start());
  const std::string noVersion = "7: unsupported protocol version 0 (current 3)";
  const Value bulk = Value::string("bulk");
  const Value three = Value::unsignedInteger(3);
  const std::vector<std::pair<AXDaemonClient::Request, std::string>> cases = {
      {envelope(bulk, std::nullopt), noVersion},
      {envelope("bulk", 1), "7: unsupported protocol version 1 (current 3)"},
      {envelope("bulk", 4), "7: unsupported protocol version 4 (current 3)"},
      // Read as an unsigned integer: a signed integer is no version at all.
      {envelope(bulk, Value::integer(3)), noVersion},
      // All 64 bits count: a version whose low 32 bits read 3 is not version 3.
      {envelope("bulk", (std::uint64_t{1} << 32) + 3),
       "7: unsupported protocol version 4294967299 (current 3)"},
      {envelope("bulk", 2), "ok"},
      {envelope("frobnicate", 1), "7: unsupported protocol version 1 (current 3)"},
      {envelope(three, three), "4: invalid request format (missing type)"},
      {envelope("BULK", 3), "4: unrecognized request"},
  };
  for (const auto& [request, expected] : cases) {
    SCOPED_TRACE(Value::dictionary(value::Dictionary(request)).description());
    EXPECT_EQ(client().outcome(request), expected);
  }
  EXPECT_EQ(client().bulk(UINT64_MAX), "ok");
  EXPECT_EQ(logCount("bulk options 0xffffffffffffffff not supported"), 1u);
  // Flags that are no unsigned integer read as 0, as missing ones do (version 2's bulk above).
  AXDaemonClient::Request textFlags = envelope("bulk", 3);
  textFlags[AXProtocol::kFlags] = Value::string("5");
  EXPECT_EQ(client().outcome(textFlags), "ok");
  EXPECT_EQ(logCount("bulk options 0x0 not supported"), 2u);
}

TEST_F(DaemonTest, EveryThousandthRequestOfAClientIsCounted) {
  ASSERT_TRUE(start({"-v"}));
  std::vector<std::future<zyn::ReplyOrError>> pending;
  for (int i = 0; i < 999; ++i) pending.push_back(client().start(envelope("bulk", 3)));
  for (auto& reply : pending) {
    ASSERT_EQ(BlockingClient::describe(BlockingClient::await(reply)), "ok");
  }
  EXPECT_EQ(logCount("requests so far"), 0u) << "after 999 requests";
  EXPECT_EQ(client().bulk(0), "ok");
  EXPECT_EQ(logCount(thisClient() + " used 1000 requests so far"), 1u);
  EXPECT_EQ(logCount("requests so far"), 1u);
}

// The decoder's refusals are tested in-process; here, the daemon's limits, and that a broken
// frame ends its own connection only.
TEST_F(DaemonTest, ABrokenFrameClosesOnlyItsOwnConnection) {
  ASSERT_TRUE(start());
  const std::vector<std::pair<std::string, std::vector<std::uint8_t>>> cases = {
      {"length over 64 MiB", {0x04, 0x00, 0x00, 0x01}},
      {"nesting deeper than 128", encoded(FrameKind::Request, 1, bulkNesting(128))},
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
  ASSERT_TRUE(start({"-v"}));
  auto raw = connectRaw();
  ASSERT_TRUE(raw);
  Value array = Value::array({Value::unsignedInteger(1), Value::unsignedInteger(2)});
  ASSERT_TRUE(raw->sendFrame(FrameKind::Request, 1, array));
  ASSERT_TRUE(raw->sendFrame(FrameKind::OneWay, 2, RawClient::bulkRequest(0x3a3a)));
  ASSERT_TRUE(raw->sendFrame(FrameKind::Control, 0,
                             Value::dictionary({{"control", Value::string("goodbye")}})));
  // The next frame the daemon sends must answer request 3: no message above got a reply, and a
  // client that said goodbye is still served.
  EXPECT_EQ(raw->request(3, RawClient::bulkRequest(0)), "ok");
  EXPECT_EQ(logCount("unexpected message [1, 2] on connection"), 1u);
  EXPECT_TRUE(daemon().waitForLog(thisClient() + " termination imminent"));
  // The one-way request was worked all the same.
  EXPECT_EQ(logCount("bulk options 0x3a3a not supported"), 1u);
}

TEST_F(DaemonTest, AClientThatLeavesInTheMiddleOfAFrameDisturbsNoOther) {
  ASSERT_TRUE(start());
  std::vector<std::uint8_t> frame = encoded(FrameKind::Request, 1, RawClient::bulkRequest(0x4a1f));
  {
    auto leaving = connectRaw();
    ASSERT_TRUE(leaving);
    ASSERT_TRUE(leaving->send(std::span(frame).first(frame.size() / 2)));
    // While the daemon waits for the rest of that frame, others are served.
    EXPECT_EQ(client().bulk(2), "ok");
  }
  EXPECT_EQ(client().bulk(3), "ok");
  expectServing();
  EXPECT_EQ(logCount("bulk options 0x4a1f"), 0u);
}

// Two clients of one process: a handler of the first may wait for a reply of the second, and a
// handler that blocks holds up only its own client, whose replies then run in order.
TEST_F(DaemonTest, EachClientRunsItsHandlersOnAQueueOfItsOwn) {
  ASSERT_TRUE(start());
  AXDaemonClient& first = client().client();
  BlockingClient second;
  // Shared: handlers that outlive a failed wait must still find their state.
  struct State {
    std::promise<std::string> nested;
    std::promise<void> gate;
    std::mutex mutex;
    std::vector<int> order;
    std::promise<void> drained;
  };
  auto state = std::make_shared<State>();

  first.bulkPlugins(
      0, [state, &second](const zyn::ReplyOrError&) { state->nested.set_value(second.bulk(0)); });
  auto nested = state->nested.get_future();
  ASSERT_EQ(nested.wait_for(BlockingClient::kReplyTimeout), std::future_status::ready);
  EXPECT_EQ(nested.get(), "ok");

  std::shared_future<void> gate = state->gate.get_future().share();
  constexpr int kReplies = 4;
  for (int i = 0; i < kReplies; ++i) {
    first.bulkPlugins(0, [state, gate, i](const zyn::ReplyOrError&) {
      if (i == 0) gate.wait();
      std::lock_guard lock(state->mutex);
      state->order.push_back(i);
      if (i == kReplies - 1) state->drained.set_value();
    });
  }
  // The first client's handler holds its queue until the gate opens; the second is served.
  EXPECT_EQ(second.bulk(0), "ok");
  EXPECT_EQ(second.bulk(1), "ok");
  state->gate.set_value();
  auto drained = state->drained.get_future();
  ASSERT_EQ(drained.wait_for(BlockingClient::kReplyTimeout), std::future_status::ready);
  std::lock_guard lock(state->mutex);
  EXPECT_EQ(state->order, std::vector<int>({0, 1, 2, 3}));
}

}  // namespace
