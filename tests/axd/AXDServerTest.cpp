// The server's request ordering: one service queue for all clients, and no work for the dead.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <future>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/os/Paths.h"
#include "platform/zyn/Frame.h"
#include "tests/axd/InProcessServer.h"
#include "tests/axd/ServiceGate.h"
#include "tests/support/BlockingClient.h"

namespace {

using value::Value;

Value bulkRequest(std::uint64_t flags) {
  return Value::dictionary({
      {AXProtocol::kRequest, Value::string(AXProtocol::kBulk)},
      {AXProtocol::kVersion, Value::unsignedInteger(AXProtocol::kCurrentVersion)},
      {AXProtocol::kFlags, Value::unsignedInteger(flags)},
  });
}

// In a forked child: connects to |address|, writes |bytes| and leaves. Only system calls, since
// the child of a process with threads must not take locks; returns the child's exit status.
int sendAndLeave(const sockaddr_un& address, const std::vector<std::uint8_t>& bytes) {
  int fd = socket(AF_UNIX, SOCK_STREAM, 0);
  if (fd < 0 || connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    return 1;
  }
  for (std::size_t sent = 0; sent < bytes.size();) {
    ssize_t n = write(fd, bytes.data() + sent, bytes.size() - sent);
    if (n <= 0) return 2;
    sent += static_cast<std::size_t>(n);
  }
  close(fd);
  return 0;
}

class AXDServerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    server_ = InProcessServer::shared().built();
    ASSERT_TRUE(server_);
    since_ = daemon().logSize();
  }

  InProcessServer& daemon() { return InProcessServer::shared(); }
  bool logged(const std::string& text) { return daemon().waitForLog(text, since_); }

  std::shared_ptr<AXDServer> server_;
  std::size_t since_ = 0;  // where this test's part of the log starts
};

TEST_F(AXDServerTest, RequestsQueuedByAClientThatDiedAreDroppedUnanswered) {
  server_->setVerbose(1);
  std::vector<std::uint8_t> frames;
  zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Request, 1, bulkRequest(0xdead1)}, frames);
  zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Request, 2, bulkRequest(0xdead2)}, frames);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::string path = os::Paths::zynSocketDir() + "/" + InProcessServer::kServiceName;
  ASSERT_LT(path.size(), sizeof address.sun_path);
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);

  ServiceGate gate(*server_);
  // The dying client is a process of its own, so that its pid names only its lines.
  pid_t child = fork();
  if (child == 0) _exit(sendAndLeave(address, frames));
  ASSERT_GT(child, 0);
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "status " << status;
  const std::string dying = "client " + std::to_string(child);
  // The connection reports its requests before its end: both are queued by now.
  ASSERT_TRUE(logged(dying + " is dead"));
  gate.release();

  // Served after the dead client's requests, so they have had their turn once this returns.
  BlockingClient other(InProcessServer::kServiceName);
  EXPECT_EQ(other.bulk(0), "ok");
  for (const std::string& line : daemon().logLines(since_)) {
    EXPECT_EQ(line.find(dying + " request"), std::string::npos) << line;
    EXPECT_EQ(line.find("bulk options 0xdead"), std::string::npos) << line;
  }
}

TEST_F(AXDServerTest, RequestsOfAllClientsAreWorkedOneAtATimeInSubmissionOrder) {
  server_->setVerbose(2);
  BlockingClient a(InProcessServer::kServiceName);
  BlockingClient b(InProcessServer::kServiceName);
  std::vector<std::future<zyn::ReplyOrError>> replies;
  // Sends a bulk request and waits until the server has taken it in, so that the next one is
  // submitted after it.
  auto submit = [&](BlockingClient& client, std::uint64_t flags, const std::string& marker) {
    AXDaemonClient::Request request = client.client().request(AXProtocol::kBulk);
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    request["marker"] = Value::string(marker);
    replies.push_back(client.start(request));
    return logged(marker);
  };

  const std::string dispatched = "client " + std::to_string(getpid()) + " request bulk";
  auto work = [&] {
    std::vector<std::string> lines;
    for (const std::string& line : daemon().logLines(since_)) {
      if (line == dispatched || line.starts_with("bulk options ")) lines.push_back(line);
    }
    return lines;
  };

  ServiceGate gate(*server_);
  ASSERT_TRUE(submit(a, 0xa1, "order-A1"));
  ASSERT_TRUE(submit(b, 0xb1, "order-B1"));
  ASSERT_TRUE(submit(a, 0xa2, "order-A2"));
  EXPECT_EQ(work(), std::vector<std::string>{}) << "worked while the service queue was busy";
  gate.release();
  for (auto& reply : replies) {
    EXPECT_EQ(BlockingClient::describe(BlockingClient::await(reply)), "ok");
  }
  // Each request's dispatch line is followed by its own handler's line before the next begins.
  EXPECT_EQ(work(), (std::vector<std::string>{dispatched, "bulk options 0xa1 not supported",
                                              dispatched, "bulk options 0xb1 not supported",
                                              dispatched, "bulk options 0xa2 not supported"}));
}

}  // namespace
