// The request envelope, bulk and the daemon's verbosity, over the daemon's real socket.

#include <cstdint>
#include <future>
#include <optional>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/support/BlockingClient.h"

namespace {

using value::Value;

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

// The version is checked first, then the type: an unusable envelope gets the first error only.
TEST_F(DaemonTest, TheEnvelopeIsCheckedVersionFirstThenType) {
  ASSERT_TRUE(start());
  BlockingClient client;
  const std::string noVersion = "7: unsupported protocol version 0 (current 3)";
  const Value bulk = Value::string("bulk");
  const Value three = Value::unsignedInteger(3);
  const std::vector<std::pair<AXDaemonClient::Request, std::string>> cases = {
      {envelope(bulk, std::nullopt), noVersion},
      {envelope("bulk", 1), "7: unsupported protocol version 1 (current 3)"},
      {envelope("bulk", 4), "7: unsupported protocol version 4 (current 3)"},
      // Read as an unsigned integer: a signed integer or text is no version at all.
      {envelope(bulk, Value::integer(3)), noVersion},
      {envelope(bulk, Value::string("3")), noVersion},
      // All 64 bits count: a version whose low 32 bits read 3 is not version 3.
      {envelope("bulk", (std::uint64_t{1} << 32) + 3),
       "7: unsupported protocol version 4294967299 (current 3)"},
      {envelope("bulk", 2), "ok"},
      {envelope("bulk", 3), "ok"},
      {envelope(std::nullopt, std::nullopt), noVersion},
      {envelope("frobnicate", 1), "7: unsupported protocol version 1 (current 3)"},
      {envelope(std::nullopt, three), "4: invalid request format (missing type)"},
      {envelope(three, three), "4: invalid request format (missing type)"},
      {envelope("BULK", 3), "4: unrecognized request"},
      {envelope("bulk ", 3), "4: unrecognized request"},
      {envelope("", 3), "4: unrecognized request"},
      {envelope("frobnicate", 3), "4: unrecognized request"},
  };
  for (const auto& [request, expected] : cases) {
    SCOPED_TRACE(Value::dictionary(value::Dictionary(request)).description());
    EXPECT_EQ(client.outcome(request), expected);
  }
}

TEST_F(DaemonTest, BulkSucceedsWithAnyFlagsAndOnlyLogsThem) {
  ASSERT_TRUE(start());
  BlockingClient client;
  EXPECT_EQ(client.bulk(0x5), "ok");
  EXPECT_EQ(client.outcome(envelope("bulk", 3)), "ok");
  EXPECT_EQ(client.bulk(0), "ok");
  EXPECT_EQ(client.bulk(UINT64_MAX), "ok");
  AXDaemonClient::Request textFlags = envelope("bulk", 3);
  textFlags[AXProtocol::kFlags] = Value::string("5");
  EXPECT_EQ(client.outcome(textFlags), "ok");

  EXPECT_EQ(logCount("bulk options 0x5 not supported"), 1u);
  // No flags, flags 0 and flags that are no unsigned integer all read as 0.
  EXPECT_EQ(logCount("bulk options 0x0 not supported"), 3u);
  EXPECT_EQ(logCount("bulk options 0xffffffffffffffff not supported"), 1u);
}

TEST_F(DaemonTest, EachVerboseFlagAddsALevelOfLogging) {
  struct Level {
    std::vector<std::string> arguments;
    bool debugLines;
    bool wholeMessages;
  };
  const std::vector<Level> levels = {{{}, false, false},
                                     {{"-v"}, true, false},
                                     {{"-v", "-v"}, true, true},
                                     {{"-vvv"}, true, true}};
  for (const Level& level : levels) {
    SCOPED_TRACE(testing::PrintToString(level.arguments));
    ASSERT_TRUE(start(level.arguments));
    BlockingClient client;
    AXDaemonClient::Request marked = envelope("bulk", 3);
    marked["marker"] = Value::string("e2e-marker-7f3a");
    EXPECT_EQ(client.outcome(marked), "ok");
    EXPECT_EQ(client.outcome(envelope("bulk", 9)), "7: unsupported protocol version 9 (current 3)");

    EXPECT_TRUE(logHasLineWith({"bulk options 0x0 not supported"}));
    EXPECT_EQ(logHasLineWith({thisClient() + " request bulk"}), level.debugLines);
    EXPECT_EQ(logHasLineWith({"incoming request ", "\"e2e-marker-7f3a\""}), level.wholeMessages);
    EXPECT_EQ(logHasLineWith({"Replying ", "unsupported protocol version 9 (current 3)"}),
              level.wholeMessages);
  }
}

TEST_F(DaemonTest, EveryThousandthRequestOfAClientIsCounted) {
  ASSERT_TRUE(start({"-v"}));
  BlockingClient client;
  std::vector<std::future<zyn::ReplyOrError>> pending;
  for (int i = 0; i < 998; ++i) pending.push_back(client.start(envelope("bulk", 3)));
  for (auto& reply : pending)
    ASSERT_EQ(BlockingClient::describe(BlockingClient::await(reply)), "ok");
  EXPECT_EQ(client.bulk(0), "ok");
  EXPECT_EQ(logCount("requests so far"), 0u) << "after 999 requests";

  EXPECT_EQ(client.bulk(0), "ok");
  EXPECT_EQ(logCount(thisClient() + " used 1000 requests so far"), 1u);
  EXPECT_EQ(logCount("requests so far"), 1u);
}

}  // namespace
