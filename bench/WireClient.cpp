#include "bench/WireClient.h"

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <optional>

#include "platform/zyn/Frame.h"

namespace {

constexpr std::size_t kLengthBytes = 4;
// The length field, the kind byte and the id.
constexpr std::size_t kHeaderBytes = 13;
constexpr std::size_t kFirstBuffer = 64 * 1024;

std::size_t frameBytes(const std::uint8_t* header) {
  return kLengthBytes + ((std::size_t{header[0]} << 24) | (std::size_t{header[1]} << 16) |
                         (std::size_t{header[2]} << 8) | header[3]);
}

}  // namespace

os::Result<std::unique_ptr<WireClient>> WireClient::connect(const std::string& path) {
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
  return std::unique_ptr<WireClient>(new WireClient(fd));
}

WireClient::WireClient(int fd) : fd_(fd), buffer_(kFirstBuffer) {}

WireClient::~WireClient() {
  close(fd_);
}

os::Status WireClient::roundTrip(std::span<const std::uint8_t> request) {
  replyBytes_ = 0;
  if (request.size() < kHeaderBytes) return os::Error{EINVAL, "the request is no whole frame"};
  os::Status sent = send(request);
  if (!sent.ok()) return sent;
  os::Status received = receive();
  if (!received.ok()) return received;
  const bool answers =
      buffer_[kLengthBytes] == static_cast<std::uint8_t>(zyn::FrameKind::Reply) &&
      std::equal(request.begin() + kLengthBytes + 1, request.begin() + kHeaderBytes,
                 buffer_.begin() + kLengthBytes + 1);
  if (!answers) return os::Error{EPROTO, "the next frame is not the reply to the request"};
  return os::success();
}

os::Status WireClient::send(std::span<const std::uint8_t> bytes) {
  while (!bytes.empty()) {
    ssize_t n = ::send(fd_, bytes.data(), bytes.size(), MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("send");
    bytes = bytes.subspan(static_cast<std::size_t>(n));
  }
  return os::success();
}

os::Status WireClient::receive() {
  std::size_t got = 0;
  std::optional<std::size_t> want;
  while (!want || got < *want) {
    ssize_t n = recv(fd_, buffer_.data() + got, buffer_.size() - got, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("recv");
    if (n == 0) return os::Error{EPIPE, "the daemon closed the connection"};
    got += static_cast<std::size_t>(n);
    if (!want && got >= kLengthBytes) {
      want = frameBytes(buffer_.data());
      if (*want <= kHeaderBytes) return os::Error{EPROTO, "a frame without an item"};
      if (buffer_.size() < *want) buffer_.resize(*want);
    }
  }
  if (got > *want) return os::Error{EPROTO, "more bytes came after the reply"};
  replyBytes_ = *want;
  return os::success();
}
