#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>

#include "Annexa/AXDaemonClient.h"
#include "bench/BulkFrames.h"
#include "platform/os/Paths.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

// A listening socket at the named service's path that reads raw bytes, with no decoding.
class RawService {
 public:
  explicit RawService(const std::string& name) {
    std::string path = os::Paths::zynSocketDir() + "/" + name;
    EXPECT_TRUE(os::Paths::ensureDirectory(os::Paths::zynSocketDir(), 0700).ok());
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    fd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    EXPECT_EQ(bind(fd_, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(listen(fd_, 1), 0);
  }
  ~RawService() { close(fd_); }

  // The first frame of the first connection, or what arrived of it within ten seconds.
  std::vector<std::uint8_t> firstFrame() {
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

 private:
  static std::vector<std::uint8_t> read(int fd, std::size_t size) {
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

  int fd_ = -1;
};

std::uint64_t idOf(const std::vector<std::uint8_t>& frame) {
  std::uint64_t id = 0;
  for (std::size_t i = 5; i < 13 && i < frame.size(); ++i) id = (id << 8) | frame[i];
  return id;
}

TEST(BulkFrames, RequestIsWhatTheClientLibrarySends) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  RawService service("bench.raw");
  std::vector<std::uint8_t> sent;
  {
    AXDaemonClient client("bench.raw");
    client.bulkPlugins(5, [](const zyn::ReplyOrError&) {});
    sent = service.firstFrame();
  }
  ASSERT_GE(sent.size(), 13u);
  EXPECT_EQ(sent, BulkFrames::request(5, idOf(sent)));
  EXPECT_NE(sent, BulkFrames::request(6, idOf(sent)));
}

}  // namespace
