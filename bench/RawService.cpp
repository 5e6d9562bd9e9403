#include "bench/RawService.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

#include "platform/os/Paths.h"

namespace {

std::vector<std::uint8_t> read(int fd, std::size_t size) {
  std::vector<std::uint8_t> bytes(size);
  std::size_t got = 0;
  while (got < size) {
    ssize_t n = recv(fd, bytes.data() + got, size - got, 0);
    if (n <= 0) break;
    got += static_cast<std::size_t>(n);
  }
  bytes.resize(got);
  return bytes;
}

}  // namespace

RawService::RawService(const std::string& name) {
  std::string path = os::Paths::zynSocketDir() + "/" + name;
  EXPECT_TRUE(os::Paths::ensureDirectory(os::Paths::zynSocketDir(), 0700).ok());
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  EXPECT_EQ(bind(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  EXPECT_EQ(listen(fd_, 1), 0);
}

RawService::~RawService() {
  close(fd_);
}

std::vector<std::uint8_t> RawService::firstFrame() {
  int peer = accept(fd_, nullptr, nullptr);
  timeval patience{10, 0};
  setsockopt(peer, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  std::vector<std::uint8_t> frame = read(peer, 4);
  if (frame.size() == 4) {
    std::size_t length = (std::size_t{frame[0]} << 24) | (std::size_t{frame[1]} << 16) |
                         (std::size_t{frame[2]} << 8) | frame[3];
    std::vector<std::uint8_t> rest = read(peer, length);
    frame.insert(frame.end(), rest.begin(), rest.end());
  }
  close(peer);
  return frame;
}

std::uint64_t RawService::idOf(const std::vector<std::uint8_t>& frame) {
  std::uint64_t id = 0;
  for (std::size_t i = 5; i < 13 && i < frame.size(); ++i) id = (id << 8) | frame[i];
  return id;
}
