// The real daemon over its real socket: the request envelope, logging, the command line and
// input that must never bring it down.

#include <gtest/gtest.h>
#include <unistd.h>

#include <future>
#include <set>

#include "Annexa/AXDaemonClient.h"
#include "tests/e2e/Program.h"
#include "tests/e2e/RawClient.h"
#include "tests/support/DaemonProcess.h"

namespace {

using value::Value;

std::unique_ptr<DaemonProcess> startDaemon(std::vector<std::string> arguments,
                                           std::string serviceName = "") {
  auto daemon = DaemonProcess::start(AXD_EXECUTABLE, {std::move(arguments), serviceName, true});
  EXPECT_TRUE(daemon.ok()) << (daemon.ok() ? "" : daemon.error().message);
  return daemon.ok() ? std::move(daemon).value() : nullptr;
}

zyn::ReplyOrError call(AXDaemonClient& client, const AXDaemonClient::Request& request) {
  std::promise<zyn::ReplyOrError> promise;
  client.send(request, [&promise](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  return promise.get_future().get();
}

// The reply's "errorcode" and "error", or (0, "") for a success.
std::pair<std::int64_t, std::string> outcome(const zyn::ReplyOrError& reply) {
  auto error = AXDaemonClient::errorInReply(reply);
  if (!error) return {0, ""};
  return {error->code(), error->localizedDescription().value_or("")};
}

AXDaemonClient::Request bulk(std::uint64_t flags, Value version = Value::unsignedInteger(3)) {
  return {{"request", Value::string("bulk")},
          {"version", std::move(version)},
          {"flags", Value::unsignedInteger(flags)}};
}

class DaemonTest : public ::testing::Test {
 protected:
  void SetUp() override {
    daemon_ = startDaemon({"-v"});
    ASSERT_TRUE(daemon_);
  }

  std::unique_ptr<DaemonProcess> daemon_;
};

TEST_F(DaemonTest, TheEnvelopeIsCheckedBeforeAnyHandler) {
  AXDaemonClient client;
  const std::pair<std::int64_t, std::string> success{0, ""};
  EXPECT_EQ(
      outcome(call(client, {{"request", Value::string("bulk")}})),
      std::make_pair(std::int64_t{7}, std::string("unsupported protocol version 0 (current 3)")));
  for (std::uint64_t version : {1, 4}) {
    EXPECT_EQ(outcome(call(client, bulk(0, Value::unsignedInteger(version)))).first, 7);
  }
  EXPECT_EQ(outcome(call(client, bulk(0, Value::integer(3)))).first, 7)
      << "a signed version is not the unsigned integer the protocol asks for";
  EXPECT_EQ(outcome(call(client, bulk(0, Value::unsignedInteger(2)))), success);
  EXPECT_EQ(outcome(call(client, bulk(0, Value::unsignedInteger(3)))), success);

  const auto missingType =
      std::make_pair(std::int64_t{4}, std::string("invalid request format (missing type)"));
  EXPECT_EQ(outcome(call(client, {{"version", Value::unsignedInteger(3)}})), missingType);
  EXPECT_EQ(outcome(call(client, {{"version", Value::unsignedInteger(3)},
                                  {"request", Value::unsignedInteger(2)}})),
            missingType);
  const auto unknown = std::make_pair(std::int64_t{4}, std::string("unrecognized request"));
  for (const char* type : {"BULK", "Bulk", "frobnicate", ""}) {
    EXPECT_EQ(outcome(call(client, {{"version", Value::unsignedInteger(3)},
                                    {"request", Value::string(type)}})),
              unknown)
        << type;
  }
}

TEST_F(DaemonTest, BulkOnlyLogsItsOptions) {
  AXDaemonClient client;
  EXPECT_EQ(outcome(call(client, bulk(0x5))).first, 0);
  EXPECT_EQ(outcome(call(client, {{"request", Value::string("bulk")},
                                  {"version", Value::unsignedInteger(3)}}))
                .first,
            0);
  EXPECT_TRUE(daemon_->waitForLog("bulk options 0x5 not supported"));
  EXPECT_TRUE(daemon_->waitForLog("bulk options 0x0 not supported"));
  EXPECT_TRUE(daemon_->waitForLog("client " + std::to_string(getpid()) + " request bulk"));
}

TEST_F(DaemonTest, EveryThousandthRequestOfAClientIsCounted) {
  AXDaemonClient client;
  const std::string counted = "client " + std::to_string(getpid()) + " used 1000 requests so far";
  std::vector<std::future<void>> replies;
  std::vector<std::promise<void>> arrived(999);
  for (auto& promise : arrived) {
    replies.push_back(promise.get_future());
    client.bulkPlugins(0, [&promise](const zyn::ReplyOrError&) { promise.set_value(); });
  }
  for (auto& reply : replies) reply.get();
  EXPECT_EQ(daemon_->log().find(counted), std::string::npos);
  EXPECT_EQ(outcome(call(client, bulk(0))).first, 0);
  EXPECT_TRUE(daemon_->waitForLog(counted));
}

TEST_F(DaemonTest, MalformedInputClosesOnlyThatConnection) {
  const std::string path = daemon_->servicePath();
  std::vector<std::vector<std::uint8_t>> bad{
      {0x04, 0x00, 0x00, 0x01, 0x01},                                      // 64 MiB + 1
      {0x00, 0x00, 0x00, 0x0b, 0x01, 0, 0, 0, 0, 0, 0, 0, 1, 0xa1, 0x61},  // truncated CBOR
      {0x00, 0x00, 0x00, 0x0a, 0x09, 0, 0, 0, 0, 0, 0, 0, 1, 0xa0},        // unknown kind 9
      {0x00, 0x00, 0x00, 0x05, 0x01, 0, 0, 0, 0},                          // shorter than a header
      {'G', 'E', 'T', ' ', '/', ' ', 'H', 'T', 'T', 'P', '/', '1', '.', '1', '\r', '\n'},
  };
  std::vector<std::uint8_t> deep{0x00, 0x00, 0x01, 0x00, 0x01, 0, 0, 0, 0, 0, 0, 0, 1};
  deep.resize(4 + 0x100, 0x81);  // 247 nested one-element arrays, never closed
  bad.push_back(deep);
  for (const auto& bytes : bad) {
    RawClient raw(path);
    ASSERT_TRUE(raw.connected());
    raw.sendBytes(bytes);
    EXPECT_TRUE(raw.closedByPeer()) << "frame starting " << int(bytes[0]) << " " << int(bytes[4]);
  }
  EXPECT_TRUE(daemon_->waitForLog("closing connection"));

  RawClient half(path);
  half.sendBytes({0x00, 0x00, 0x00, 0x20, 0x01, 0, 0});
  half.close();

  ASSERT_TRUE(daemon_->running());
  AXDaemonClient client;
  EXPECT_EQ(outcome(call(client, bulk(0))).first, 0);
}

TEST_F(DaemonTest, OddMessagesGetNoReplyButTheirWorkIsDone) {
  RawClient raw(daemon_->servicePath());
  raw.sendFrame(zyn::FrameKind::Request, 1, Value::array({Value::string("bulk")}));
  EXPECT_FALSE(raw.receive(std::chrono::milliseconds(300)));
  EXPECT_TRUE(daemon_->waitForLog("unexpected message"));

  raw.sendFrame(zyn::FrameKind::OneWay, 2, Value::dictionary(value::Dictionary(bulk(0x77))));
  EXPECT_TRUE(daemon_->waitForLog("bulk options 0x77 not supported"));

  raw.sendFrame(zyn::FrameKind::Control, 0,
                Value::dictionary({{"control", Value::string("goodbye")}}));
  EXPECT_TRUE(daemon_->waitForLog("termination imminent"));
  raw.sendFrame(zyn::FrameKind::Request, 3, Value::dictionary(value::Dictionary(bulk(0x78))));
  auto reply = raw.receive();
  ASSERT_TRUE(reply) << "a client that said goodbye is still served";
  EXPECT_EQ(reply->kind, zyn::FrameKind::Reply);
  EXPECT_EQ(reply->id, 3u);
  EXPECT_EQ(reply->body, Value::dictionary({}));
}

TEST(DaemonVerbosity, TwoVsWriteWholeMessagesAndNoneWritesNoDebugLines) {
  {
    auto loud = startDaemon({"-v", "-v"});
    ASSERT_TRUE(loud);
    AXDaemonClient client;
    EXPECT_EQ(outcome(call(client, bulk(0xabc))).first, 0);
    EXPECT_TRUE(
        loud->waitForLog("incoming request {\"flags\": 2748, \"request\": \"bulk\", "
                         "\"version\": 3}"));
    EXPECT_TRUE(loud->waitForLog("Replying {}"));
  }
  auto quiet = startDaemon({});
  ASSERT_TRUE(quiet);
  AXDaemonClient client;
  EXPECT_EQ(outcome(call(client, bulk(0xabc))).first, 0);
  EXPECT_TRUE(quiet->waitForLog("bulk options 0xabc not supported"));
  EXPECT_EQ(quiet->log().find("incoming request"), std::string::npos);
  EXPECT_EQ(quiet->log().find("request bulk"), std::string::npos);
}

TEST(DaemonCommandLine, BadCommandLinesGiveTheUsageAndStatus2) {
  for (std::vector<std::string> arguments :
       {std::vector<std::string>{"stray"}, {"-x"}, {"-S"}, {"-v", "--", "stray"}}) {
    arguments.insert(arguments.begin(), AXD_EXECUTABLE);
    Program axd = Program::run(arguments);
    EXPECT_EQ(axd.status, 2) << arguments[1];
    EXPECT_EQ(axd.err, "Usage: axd [-S servicename] [-v]\n") << arguments[1];
    EXPECT_EQ(axd.err.size(), 33u);
  }
}

TEST(DaemonCommandLine, OtherNamesAndNonNumericCacheLimitsStillServe) {
  auto daemon = startDaemon({"-S", "org.example.other", "-c", "notanumber"}, "org.example.other");
  ASSERT_TRUE(daemon);
  AXDaemonClient client("org.example.other");
  EXPECT_EQ(outcome(call(client, bulk(0))).first, 0);
}

TEST(DaemonCommandLine, AnOccupiedNameIsRefused) {
  auto first = startDaemon({});
  ASSERT_TRUE(first);
  Program second = Program::run({AXD_EXECUTABLE});
  EXPECT_EQ(second.status, 1);
  EXPECT_TRUE(first->running());
}

// Every probe in the binary is one of the provider's ten; a probe is only in the binary once a
// handler fires it, so the service spine's five must be there.
TEST(DaemonProbes, TheBinaryCarriesTheProbesOfProviderAxd) {
#ifndef AXD_HAVE_SDT
  GTEST_SKIP() << "built without sys/sdt.h";
#endif
  Program readelf = Program::run({"/usr/bin/readelf", "-n", AXD_EXECUTABLE});
  if (readelf.status != 0) GTEST_SKIP() << "no readelf";
  const std::set<std::string> provider{
      "client__new",   "client__done", "request__input", "request",       "request__output",
      "discover__raw", "plugin__add",  "plugin__remove", "plugin__ready", "db__load"};
  std::set<std::string> found;
  const std::string marker = "Provider: axd\n    Name: ";
  for (std::size_t at = 0; (at = readelf.out.find(marker, at)) != std::string::npos;) {
    at += marker.size();
    found.insert(readelf.out.substr(at, readelf.out.find('\n', at) - at));
  }
  for (const auto& probe : found) EXPECT_TRUE(provider.count(probe)) << probe;
  for (const char* probe :
       {"client__new", "client__done", "request__input", "request", "request__output"}) {
    EXPECT_TRUE(found.count(probe)) << probe;
  }
}

}  // namespace
