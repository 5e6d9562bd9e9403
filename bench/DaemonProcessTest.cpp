#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>

#include "bench/BulkFrames.h"
#include "tests/support/DaemonProcess.h"

namespace {

std::string environmentRoot() {
  const char* root = std::getenv("ANNEXA_ROOT");
  return root ? root : "(unset)";
}

// Sends |request| on a fresh connection to |path| and returns up to |replyBytes| of the answer.
std::vector<std::uint8_t> exchange(const std::string& path,
                                   const std::vector<std::uint8_t>& request,
                                   std::size_t replyBytes) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  timeval patience{10, 0};
  setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  std::vector<std::uint8_t> reply(replyBytes);
  std::size_t got = 0;
  if (connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0 &&
      send(fd, request.data(), request.size(), MSG_NOSIGNAL) == ssize_t(request.size())) {
    for (ssize_t n; got < replyBytes && (n = recv(fd, &reply[got], replyBytes - got, 0)) > 0;) {
      got += static_cast<std::size_t>(n);
    }
  }
  close(fd);
  reply.resize(got);
  return reply;
}

TEST(DaemonProcess, ServesOnAFreshRootAndLeavesNothingBehind) {
  const std::string before = environmentRoot();
  std::string root;
  pid_t pid = 0;
  {
    auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
    ASSERT_TRUE(daemon.ok()) << daemon.error().message;
    root = daemon.value()->root();
    pid = daemon.value()->pid();
    EXPECT_EQ(environmentRoot(), root);
    EXPECT_EQ(DaemonProcess::socketPath().rfind(root + "/", 0), 0u);
    // The reply frame the raw baseline answers with is the daemon's, byte for byte.
    EXPECT_EQ(exchange(DaemonProcess::socketPath(), BulkFrames::request(0, 7), 14),
              BulkFrames::reply(7));
  }
  struct stat info;
  EXPECT_NE(stat(root.c_str(), &info), 0);
  EXPECT_EQ(environmentRoot(), before);
  EXPECT_NE(kill(pid, 0), 0) << "the daemon was not reaped";
}

TEST(DaemonProcess, FailsClearlyWhenTheDaemonCannotServe) {
  const std::string before = environmentRoot();
  auto missing = DaemonProcess::start("/nonexistent/axd");
  ASSERT_FALSE(missing.ok());
  EXPECT_EQ(missing.error().errnum, ENOENT);
  EXPECT_NE(missing.error().message.find("/nonexistent/axd"), std::string::npos);

  auto quitter = DaemonProcess::start("/bin/false");
  ASSERT_FALSE(quitter.ok());
  EXPECT_EQ(quitter.error().errnum, ECHILD);
  EXPECT_NE(quitter.error().message.find("exit status 1"), std::string::npos);
  EXPECT_EQ(environmentRoot(), before);
}

}  // namespace
