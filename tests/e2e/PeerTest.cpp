// A connection that changes hands: a child that inherited it, another program exec'd in the
// process that made it, the children of a client-library host, and the reading of a
// connecting program's image.

#include <fcntl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/os/Digest.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using value::Value;

const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";

std::vector<std::uint8_t> requestFrame(std::uint64_t id, std::uint64_t flags) {
  std::vector<std::uint8_t> bytes;
  zyn::encodeFrame(zyn::Frame{zyn::FrameKind::Request, id, RawClient::bulkRequest(flags)}, bytes);
  return bytes;
}

// Writes |frame| on |fd| and reads until a whole frame or the end of the stream: true when the
// stream ended unanswered. System calls only: safe in a child forked from a threaded process.
bool endsUnanswered(int fd, const std::vector<std::uint8_t>& frame) {
  if (write(fd, frame.data(), frame.size()) != static_cast<ssize_t>(frame.size())) return false;
  std::uint8_t buffer[4096];
  std::uint8_t length[4];
  std::size_t total = 0;
  std::size_t wanted = sizeof length;
  while (total < wanted) {
    std::size_t ask = total < sizeof length ? sizeof length - total : wanted - total;
    ssize_t n = read(fd, buffer, ask < sizeof buffer ? ask : sizeof buffer);
    if (n <= 0) return n == 0;
    if (total < sizeof length) std::memcpy(length + total, buffer, static_cast<std::size_t>(n));
    total += static_cast<std::size_t>(n);
    if (total == sizeof length) {
      wanted += (std::size_t{length[0]} << 24) | (std::size_t{length[1]} << 16) |
                (std::size_t{length[2]} << 8) | std::size_t{length[3]};
    }
  }
  return false;
}

std::string hex(const std::vector<std::uint8_t>& bytes) {
  std::string text;
  char digits[3];
  for (std::uint8_t byte : bytes) {
    std::snprintf(digits, sizeof digits, "%02x", byte);
    text += digits;
  }
  return text;
}

int exitStatus(pid_t child) {
  int status = 0;
  if (waitpid(child, &status, 0) != child || !WIFEXITED(status)) return -1;
  return WEXITSTATUS(status);
}

// Writes a request frame (argv[2], hex) on descriptor argv[1] and prints "closed" when the
// stream then ends unanswered, "reply" otherwise.
constexpr const char* kWriter = R"(import os, sys
fd = int(sys.argv[1])
os.write(fd, bytes.fromhex(sys.argv[2]))
data = b""
while len(data) < 4 or len(data) < 4 + int.from_bytes(data[:4], "big"):
    chunk = os.read(fd, 65536)
    if not chunk:
        break
    data += chunk
print("reply" if data else "closed")
)";

class PeerTest : public DaemonTest {
 protected:
  void SetUp() override { ASSERT_TRUE(start()); }
};

TEST_F(PeerTest, ChildOfTheConnectingProcessIsRefusedAndTheConnectionClosed) {
  auto raw = connectRaw();
  ASSERT_TRUE(raw);
  ASSERT_NE(raw->request(1, RawClient::bulkRequest(0)), "no reply");
  std::vector<std::uint8_t> frame = requestFrame(2, 0);
  pid_t child = fork();
  if (child == 0) _exit(endsUnanswered(raw->fd(), frame) ? 0 : 1);
  ASSERT_GT(child, 0);
  EXPECT_EQ(exitStatus(child), 0);
  EXPECT_TRUE(raw->closedByPeer());
  EXPECT_EQ(logCount("not by the peer"), 1u);
  expectServing();
}

TEST_F(PeerTest, ProgramExecedAfterConnectingIsRefusedAndTheConnectionClosed) {
  // The program exec'd is entitled; the one that connected (this one) is not.
  const std::string python = "/usr/bin/python3";
  bundles::grantProgram(root(), "python", python, {{kManager, Value::boolean(true)}});
  std::vector<std::uint8_t> ping = requestFrame(1, 0);
  std::string frame = hex(requestFrame(2, AXProtocol::AXDiscoverAll));
  std::vector<std::string> words{python, "-c", kWriter, "10", frame};
  std::vector<char*> argv;
  for (auto& word : words) argv.push_back(word.data());
  argv.push_back(nullptr);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::string path = daemon().servicePath();
  ASSERT_LT(path.size(), sizeof address.sun_path);
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  int out[2];
  ASSERT_EQ(pipe2(out, O_CLOEXEC), 0);
  pid_t child = fork();
  if (child == 0) {
    int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
        endsUnanswered(fd, ping) || dup2(fd, 10) != 10 || dup2(out[1], STDOUT_FILENO) < 0) {
      _exit(2);
    }
    execv(argv[0], argv.data());
    _exit(127);
  }
  close(out[1]);
  ASSERT_GT(child, 0);
  std::string printed;
  char buffer[256];
  for (ssize_t n; (n = read(out[0], buffer, sizeof buffer)) > 0;)
    printed.append(buffer, static_cast<std::size_t>(n));
  close(out[0]);
  EXPECT_EQ(exitStatus(child), 0);
  EXPECT_EQ(printed, "closed\n");
  EXPECT_EQ(logCount("runs another program than when it connected"), 1u);
  expectServing();
}

TEST_F(PeerTest, ChildOfAHostInheritsNoConnection) {
  ASSERT_EQ(client().bulk(0), "ok");
  Subprocess::Outcome listing = Subprocess::run("/bin/ls", {"-l", "/proc/self/fd"});
  EXPECT_EQ(listing.status, 0) << listing.err;
  EXPECT_NE(listing.out.find("/proc/"), std::string::npos) << listing.out;
  EXPECT_EQ(listing.out.find("socket:"), std::string::npos) << listing.out;
}

}  // namespace

// A table entry with a digest makes each set-up check the client's image; it is read once for
// many connections of the same program, and the entitlements still hold from the first request.
TEST_F(PeerTest, AProgramWithADigestEntryIsHashedOnceForAllItsConnections) {
  const std::string self = std::filesystem::canonical("/proc/self/exe").string();
  auto digest = os::Digest::sha256File(self);
  ASSERT_TRUE(digest.ok());
  std::string table = root() + "/etc/annexa/entitlements.d/e2e_tests.plist";
  bundles::writePlist(table,
                      Value::dictionary({
                          {"Executable", Value::string(self)},
                          {"SHA256", Value::string(digest.value())},
                          {"Entitlements", Value::dictionary({{kManager, Value::boolean(true)}})},
                      }));
  std::filesystem::permissions(table, std::filesystem::perms(0644));
  for (int connect = 0; connect < 5; ++connect) {
    BlockingClient fresh;
    EXPECT_EQ(fresh.outcome(fresh.client().request(AXProtocol::kRemove, {"/no/such.appex"})),
              "9: no plugin at /no/such.appex");
  }
  EXPECT_EQ(logCount("hashing " + self), 1u);
}
