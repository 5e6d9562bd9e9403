#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <future>
#include <mutex>

#include "platform/os/Paths.h"
#include "platform/zyn/Connection.h"
#include "platform/zyn/Listener.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Value;

// A listener on a temporary device root whose connections hand every event to |onEvent|. The
// handlers share their state with the listener, which outlives the test: events that arrive
// after the test ended find it still there.
class Service {
 public:
  using OnEvent = std::function<void(zyn::Connection&, const zyn::Event&)>;

  explicit Service(OnEvent onEvent) : state_(std::make_shared<State>()) {
    state_->onEvent = std::move(onEvent);
    environment_.set("ANNEXA_ROOT", root_.path());
    auto listener = zyn::Listener::create("test.zyn", std::make_shared<zyn::StrandQueue>("t"));
    EXPECT_TRUE(listener.ok());
    listener_ = listener.value();
    listener_->setEventHandler([state = state_](std::shared_ptr<zyn::Connection> connection) {
      std::weak_ptr<zyn::Connection> weak = connection;
      connection->setEventHandler([state, weak](const zyn::Event& event) {
        auto c = weak.lock();
        std::lock_guard lock(state->mutex);
        if (c && state->onEvent) state->onEvent(*c, event);
      });
      connection->resume();
      std::lock_guard lock(state->mutex);
      state->connections.push_back(std::move(connection));
    });
    listener_->resume();
  }

  ~Service() {
    std::lock_guard lock(state_->mutex);
    state_->onEvent = nullptr;
  }

 private:
  struct State {
    std::mutex mutex;
    OnEvent onEvent;
    std::vector<std::shared_ptr<zyn::Connection>> connections;
  };

  TempDirectory root_;
  ScopedEnvironment environment_;
  std::shared_ptr<State> state_;
  std::shared_ptr<zyn::Listener> listener_;
};

Value numbered(std::int64_t n) {
  return Value::dictionary({{"n", Value::integer(n)}});
}

TEST(ConnectionTest, RepliesReachTheRequestTheyAnswerWhateverTheirOrder) {
  std::mutex mutex;
  std::vector<zyn::Message> held;
  Service service([&](zyn::Connection& connection, const zyn::Event& event) {
    const auto* message = std::get_if<zyn::Message>(&event);
    if (!message) return;
    std::lock_guard lock(mutex);
    held.push_back(*message);
    if (held.size() < 2) return;
    for (auto it = held.rbegin(); it != held.rend(); ++it) {
      zyn::Reply reply(*it);
      reply.set("echo", *it->body.asDictionary()->find("n"));
      connection.send(reply);
    }
  });
  auto client = zyn::Connection::toService("test.zyn", std::make_shared<zyn::StrandQueue>("c"));
  client->setEventHandler([](const zyn::Event&) {});
  client->resume();
  std::promise<Value> first, second;
  client->sendWithReply(numbered(1),
                        [&](const zyn::ReplyOrError& r) { first.set_value(std::get<Value>(r)); });
  client->sendWithReply(numbered(2),
                        [&](const zyn::ReplyOrError& r) { second.set_value(std::get<Value>(r)); });
  EXPECT_EQ(*first.get_future().get().asDictionary()->find("echo"), Value::integer(1));
  EXPECT_EQ(*second.get_future().get().asDictionary()->find("echo"), Value::integer(2));
  client->cancel();
}

// A frame of exactly the limit passes, both its sender's check and its reader's; one byte more
// is not sent, and the connection goes on.
TEST(ConnectionTest, TheFrameLimitHoldsForSendingAsForReading) {
  ScopedEnvironment environment;
  environment.set("AXD_MAX_FRAME_BYTES", "16384");
  Service service([](zyn::Connection& connection, const zyn::Event& event) {
    const auto* message = std::get_if<zyn::Message>(&event);
    if (!message) return;
    zyn::Reply reply(*message);
    reply.set("bytes", Value::unsignedInteger(message->body.asData()->size()));
    connection.send(reply);
  });
  auto client = zyn::Connection::toService("test.zyn", std::make_shared<zyn::StrandQueue>("c"));
  client->setEventHandler([](const zyn::Event&) {});
  client->resume();
  // A frame of n data bytes (256 <= n < 65536) is 9 header bytes, a 3-byte head and the data.
  const std::vector<std::pair<std::size_t, std::string>> cases = {
      {16384 - 13, "16371"},
      {16384 - 12, "16372"},
      {16384 - 11, "request too large (16385 bytes, limit 16384)"},
      {256, "256"},
  };
  for (const auto& [bytes, expected] : cases) {
    std::promise<std::string> outcome;
    client->sendWithReply(Value::data(value::Data(bytes, 0x5a)), [&](const zyn::ReplyOrError& r) {
      const auto* body = std::get_if<Value>(&r);
      outcome.set_value(body ? body->asDictionary()->find("bytes")->description()
                             : std::get<zyn::ServiceError>(r).description);
    });
    EXPECT_EQ(outcome.get_future().get(), expected);
  }
  client->cancel();
}

TEST(ConnectionTest, APeerThatDoesNotReadIsDisconnectedAtTheBacklogBound) {
  std::promise<void> invalid;
  Service service([&](zyn::Connection& connection, const zyn::Event& event) {
    if (std::holds_alternative<zyn::Message>(event)) {
      Value chunk = Value::data(value::Data(1 << 20, 0x5a));
      for (std::size_t i = 0; i <= zyn::Connection::kMaxBacklogBytes >> 20; ++i) {
        connection.sendMessage(chunk);
      }
    } else if (std::get<zyn::ServiceError>(event).kind == zyn::ErrorKind::ConnectionInvalid) {
      invalid.set_value();
    }
  });
  // A raw client that sends one request and never reads.
  int fd = socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::string path = os::Paths::zynSocketDir() + "/test.zyn";
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
  ASSERT_EQ(connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  std::vector<std::uint8_t> frame;
  zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Request, 1, numbered(1)}, frame);
  ASSERT_EQ(write(fd, frame.data(), frame.size()), static_cast<ssize_t>(frame.size()));
  EXPECT_EQ(invalid.get_future().wait_for(std::chrono::seconds(30)), std::future_status::ready);
  close(fd);
}

}  // namespace
