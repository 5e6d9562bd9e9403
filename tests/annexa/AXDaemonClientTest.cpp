#include <gtest/gtest.h>

#include <condition_variable>
#include <future>
#include <mutex>

#include "Annexa/AXDaemonClient.h"
#include "Annexa/AXProtocol.h"
#include "platform/zyn/Listener.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Value;

// A stand-in daemon on a temporary device root: it records every request and answers each with
// an empty dictionary. Its state is shared with the listener, which outlives the test.
class FakeDaemon {
 public:
  FakeDaemon() : state_(std::make_shared<State>()) {
    environment_.set("ANNEXA_ROOT", root_.path());
    auto listener = zyn::Listener::create("test.axd", std::make_shared<zyn::StrandQueue>("test"));
    EXPECT_TRUE(listener.ok());
    listener_ = listener.value();
    listener_->setEventHandler([state = state_](std::shared_ptr<zyn::Connection> connection) {
      std::weak_ptr<zyn::Connection> weak = connection;
      connection->setEventHandler([state, weak](const zyn::Event& event) {
        const auto* message = std::get_if<zyn::Message>(&event);
        auto connection = weak.lock();
        if (!message || !connection) return;
        state->record(message->body);
        connection->send(zyn::Reply(*message));
      });
      connection->resume();
    });
    listener_->resume();
  }

  // The next request the daemon received, waiting for it when needed.
  value::Dictionary nextRequest() {
    std::unique_lock lock(state_->mutex);
    state_->arrived.wait_for(lock, std::chrono::seconds(10),
                             [this] { return !state_->requests.empty(); });
    if (state_->requests.empty()) return {};
    value::Dictionary request = state_->requests.front();
    state_->requests.erase(state_->requests.begin());
    return request;
  }

 private:
  struct State {
    void record(const Value& body) {
      std::lock_guard lock(mutex);
      requests.push_back(body.asDictionary() ? *body.asDictionary() : value::Dictionary());
      arrived.notify_all();
    }

    std::mutex mutex;
    std::condition_variable arrived;
    std::vector<value::Dictionary> requests;
  };

  TempDirectory root_;
  ScopedEnvironment environment_;
  std::shared_ptr<State> state_;
  std::shared_ptr<zyn::Listener> listener_;
};

zyn::ReplyOrError waitFor(const std::function<void(AXDaemonClient::ReplyHandler)>& send) {
  std::promise<zyn::ReplyOrError> promise;
  auto future = promise.get_future();
  send([&promise](const zyn::ReplyOrError& reply) { promise.set_value(reply); });
  return future.get();
}

TEST(AXDaemonClientRequests, CarryTheirTypeVersionAndFields) {
  FakeDaemon daemon;
  AXDaemonClient client("test.axd");
  value::Uuid token = value::Uuid::random();

  waitFor([&](auto reply) { client.matchPlugIns(std::nullopt, 0x8, reply); });
  value::Dictionary match = daemon.nextRequest();
  EXPECT_EQ(*match.find("request"), Value::string("match"));
  EXPECT_EQ(match.find("version")->asUInt(), 3u);
  EXPECT_EQ(match.find("flags")->asUInt(), 0x8u);
  EXPECT_EQ(match.find("rules"), nullptr);

  waitFor([&](auto reply) { client.releaseHold(token, reply); });
  value::Dictionary release = daemon.nextRequest();
  EXPECT_EQ(*release.find("request"), Value::string("lock"));
  EXPECT_EQ(*release.find("uuids"), Value::array({Value::uuid(token)}));
  EXPECT_EQ(release.find("paths"), nullptr);

  client.setProtocolVersion(2);
  waitFor([&](auto reply) { client.addPlugIns({"/a.appex", "/b.appex"}, reply); });
  value::Dictionary add = daemon.nextRequest();
  EXPECT_EQ(add.find("version")->asUInt(), 2u);
  EXPECT_EQ(*add.find("paths"),
            Value::array({Value::string("/a.appex"), Value::string("/b.appex")}));
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

TEST(AXDaemonClientReplies, TheEnvelopeExistsOnlyInVersion3) {
  Value list = Value::array({Value::dictionary({{"identifier", Value::string("x")}})});
  EXPECT_FALSE(AXDaemonClient::convertToZyn(list, 2));
  auto envelope = AXDaemonClient::convertToZyn(list, 3);
  ASSERT_TRUE(envelope);

  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  AXDaemonClient client("nobody.listens");
  EXPECT_EQ(client.convertFromZyn(*envelope), list);
  EXPECT_FALSE(client.convertFromZyn(list));
  client.setProtocolVersion(2);
  EXPECT_FALSE(client.convertFromZyn(*envelope));
}

}  // namespace
