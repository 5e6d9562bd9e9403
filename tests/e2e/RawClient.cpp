#include "tests/e2e/RawClient.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

RawClient::RawClient(const std::string& socketPath) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", socketPath.c_str());
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (connect(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) close();
}

RawClient::~RawClient() {
  close();
}

void RawClient::close() {
  if (fd_ >= 0) ::close(fd_);
  fd_ = -1;
}

void RawClient::sendBytes(const std::vector<std::uint8_t>& bytes) {
  std::size_t sent = 0;
  while (fd_ >= 0 && sent < bytes.size()) {
    ssize_t n = ::send(fd_, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL);
    if (n <= 0) return;
    sent += static_cast<std::size_t>(n);
  }
}

void RawClient::sendFrame(zyn::FrameKind kind, std::uint64_t id, const value::Value& body) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(zyn::Frame{kind, id, body}, bytes);
  sendBytes(bytes);
}

std::optional<zyn::Frame> RawClient::receive(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  for (;;) {
    auto next = decoder_.next();
    if (!next.ok()) return std::nullopt;
    if (next.value()) return std::move(*next.value());
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    pollfd ready{fd_, POLLIN, 0};
    if (fd_ < 0 || left.count() <= 0 || poll(&ready, 1, static_cast<int>(left.count())) <= 0) {
      return std::nullopt;
    }
    ssize_t n = ::recv(fd_, decoder_.prepare(4096), 4096, 0);
    if (n <= 0) return std::nullopt;
    decoder_.commit(static_cast<std::size_t>(n));
  }
}

bool RawClient::closedByPeer(std::chrono::milliseconds timeout) {
  pollfd ready{fd_, POLLIN, 0};
  if (fd_ < 0 || poll(&ready, 1, static_cast<int>(timeout.count())) <= 0) return false;
  char byte;
  return ::recv(fd_, &byte, 1, MSG_PEEK) == 0 || (ready.revents & (POLLHUP | POLLERR));
}
