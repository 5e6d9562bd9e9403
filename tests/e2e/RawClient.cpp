#include "tests/e2e/RawClient.h"

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
  timeval wait{kTimeout.count(), 0};
  setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &wait, sizeof wait);
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

std::string RawClient::request(std::uint64_t id, const Value& body) {
  if (!sendFrame(zyn::FrameKind::Request, id, body)) return "cannot send";
  return reply(id);
}

std::string RawClient::reply(std::uint64_t id) {
  for (;;) {
    auto next = decoder_.next();
    if (!next.ok()) return "no reply";
    if (const auto& reply = next.value()) {
      if (reply->kind != zyn::FrameKind::Reply || reply->id != id) return "no reply";
      return BlockingClient::describe(zyn::ReplyOrError(reply->body));
    }
    if (!fill()) return "no reply";
  }
}

bool RawClient::closedByPeer() {
  // Whatever the daemon sends before closing stays unread in the decoder.
  while (fill()) {
  }
  return ended_;
}

bool RawClient::fill() {
  std::uint8_t* space = decoder_.prepare(kReadChunk);
  ssize_t n = 0;
  do n = recv(fd_, space, kReadChunk, 0);
  while (n < 0 && errno == EINTR);
  if (n > 0) {
    decoder_.commit(static_cast<std::size_t>(n));
    return true;
  }
  // The end of the stream; a reset (the daemon closed with our bytes unread) is one too.
  ended_ = n == 0 || (errno != EAGAIN && errno != EWOULDBLOCK);
  return false;
}
