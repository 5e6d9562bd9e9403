#include "tests/e2e/RawClient.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "tests/support/BlockingClient.h"

using value::Value;

namespace {

constexpr std::size_t kReadChunk = 64 * 1024;

}  // namespace

os::Result<std::unique_ptr<RawClient>> RawClient::connect(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return os::Error{ENAMETOOLONG, path};
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return os::Error::fromErrno("socket");
  if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    os::Error error = os::Error::fromErrno("connect " + path);
    close(fd);
    return error;
  }
  return std::unique_ptr<RawClient>(new RawClient(fd));
}

RawClient::~RawClient() {
  close(fd_);
}

Value RawClient::bulkRequest(std::uint64_t flags) {
  return Value::dictionary({
      {AXProtocol::kRequest, Value::string(AXProtocol::kBulk)},
      {AXProtocol::kVersion, Value::unsignedInteger(AXProtocol::kCurrentVersion)},
      {AXProtocol::kFlags, Value::unsignedInteger(flags)},
  });
}

bool RawClient::send(std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    ssize_t n = ::send(fd_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) return false;
    bytes = bytes.subspan(static_cast<std::size_t>(n));
  }
  return true;
}

bool RawClient::sendFrame(zyn::FrameKind kind, std::uint64_t id, const Value& body) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(zyn::Frame{kind, id, body}, bytes);
  return send(bytes);
}

std::optional<zyn::Frame> RawClient::readFrame(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  for (;;) {
    auto next = decoder_.next();
    if (!next.ok()) return std::nullopt;
    if (next.value()) return std::move(*next.value());
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0 || !fill(left)) return std::nullopt;
  }
}

std::string RawClient::request(std::uint64_t id, const Value& body) {
  if (!sendFrame(zyn::FrameKind::Request, id, body)) return "cannot send";
  std::optional<zyn::Frame> reply = readFrame();
  if (!reply || reply->kind != zyn::FrameKind::Reply || reply->id != id) return "no reply";
  return BlockingClient::describe(zyn::ReplyOrError(reply->body));
}

bool RawClient::closedByPeer(std::chrono::milliseconds timeout) {
  const auto deadline = std::chrono::steady_clock::now() + timeout;
  // Whatever the daemon sends before closing stays unread in the decoder.
  while (!ended_) {
    auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return false;
    fill(left);
  }
  return true;
}

bool RawClient::fill(std::chrono::milliseconds timeout) {
  if (ended_) return false;
  pollfd readable{fd_, POLLIN, 0};
  int ready = poll(&readable, 1, static_cast<int>(timeout.count()));
  if (ready < 0 && errno == EINTR) return true;
  if (ready <= 0) return false;
  std::uint8_t* space = decoder_.prepare(kReadChunk);
  ssize_t n = recv(fd_, space, kReadChunk, 0);
  if (n < 0 && errno == EINTR) return true;
  if (n <= 0) {
    // The end of the stream; a reset (the daemon closed with our bytes unread) is one too.
    ended_ = true;
    return false;
  }
  decoder_.commit(static_cast<std::size_t>(n));
  return true;
}
