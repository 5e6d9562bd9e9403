#pragma once

#include <sys/socket.h>
#include <unistd.h>

#include <memory>

#include "axd/AXDServer.h"
#include "axd/AXDZynClient.h"
#include "platform/os/Process.h"
#include "platform/zyn/Connection.h"
#include "platform/zyn/Runtime.h"

// This process as a client of the in-process server, over a socket pair. The listener keeps no
// hold of the clients it makes, so the test makes its own the way the listener does.
class SelfClient {
 public:
  SelfClient() {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) != 0) return;
    peerEnd_ = fds[1];
    asio::local::stream_protocol::socket socket(zyn::Runtime::shared().context());
    socket.assign(asio::local::stream_protocol(), fds[0]);
    auto pidfd = os::Process::openPidfd(getpid());
    auto program = os::Process::executableIdentity(getpid());
    zyn::PeerCredentials peer{getpid(), getuid(), getgid(), pidfd.ok() ? pidfd.value() : -1,
                              program.ok() ? std::optional(program.value()) : std::nullopt};
    auto connection =
        zyn::Connection::accepted(std::move(socket), peer, "self", zyn::FrameLimits{});
    client_ = AXDZynClient::setUpConnection(connection, AXDServer::server());
  }
  // Closing our end ends the connection, and with it the client.
  ~SelfClient() {
    if (peerEnd_ >= 0) close(peerEnd_);
  }
  SelfClient(const SelfClient&) = delete;
  SelfClient& operator=(const SelfClient&) = delete;

  const std::shared_ptr<AXDZynClient>& client() const { return client_; }

 private:
  int peerEnd_ = -1;
  std::shared_ptr<AXDZynClient> client_;
};
