#include <gtest/gtest.h>

#include <future>

#include "Annexa/AXDaemonClient.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Value;

zyn::ReplyOrError waitFor(const std::function<void(AXDaemonClient::ReplyHandler)>& send) {
  std::promise<zyn::ReplyOrError> promise;
  auto future = promise.get_future();
  send([&promise](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  return future.get();
}

TEST(AXDaemonClientRequests, ABrokenConnectionAnswersEveryRequestWithCode4) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  AXDaemonClient client("nobody.listens");
  for (int i = 0; i < 2; ++i) {
    auto error = AXDaemonClient::errorInReply(waitFor([&](auto r) { client.bulkPlugins(0, r); }));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code(), 4);
    EXPECT_NE(error->localizedDescription()->find("Connection invalid"), std::string::npos);
  }
}

TEST(AXDaemonClientReplies, ErrorInReplyReadsCodeAndMessage) {
  auto reply = [](value::Dictionary d) { return zyn::ReplyOrError(Value::dictionary(d)); };
  EXPECT_FALSE(AXDaemonClient::errorInReply(reply({})));
  EXPECT_FALSE(AXDaemonClient::errorInReply(reply({{"errorcode", Value::unsignedInteger(0)}})));

  auto nine = AXDaemonClient::errorInReply(reply({{"errorcode", Value::unsignedInteger(9)}}));
  ASSERT_TRUE(nine);
  EXPECT_EQ(nine->domain(), "Annexa");
  EXPECT_EQ(nine->code(), 9);
  EXPECT_EQ(nine->localizedDescription(), "unknown error returned by Annexa subsystem");

  auto eleven = AXDaemonClient::errorInReply(
      reply({{"errorcode", Value::unsignedInteger(11)}, {"error", Value::string("denied")}}));
  EXPECT_EQ(eleven->code(), 11);
  EXPECT_EQ(eleven->localizedDescription(), "denied");

  try {
    AXDaemonClient::errorInReply(reply({{"error", Value::string("boom")}}));
    FAIL() << "a message without a code must be refused";
  } catch (const AXInternalInconsistency& breach) {
    EXPECT_STREQ(breach.what(), "axd reported error without a code: boom");
  }
}

}  // namespace
