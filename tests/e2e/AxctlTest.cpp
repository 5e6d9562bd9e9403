// axctl against the real daemon, and the daemon under socket activation.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>

#include "Annexa/AXDaemonClient.h"
#include "platform/os/Paths.h"
#include "tests/e2e/Program.h"
#include "tests/e2e/RawClient.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"
#include "tests/support/DaemonProcess.h"

namespace {

TEST(Axctl, BulkSucceedsAndFailuresCarryTheirCode) {
  auto daemon = DaemonProcess::start(AXD_EXECUTABLE);
  ASSERT_TRUE(daemon.ok()) << daemon.error().message;

  Program ok = Program::run({AXCTL_EXECUTABLE, "bulk", "--flags", "0x5"});
  EXPECT_EQ(ok.status, 0) << ok.err;
  EXPECT_EQ(ok.out, "ok\n");

  Program json = Program::run({AXCTL_EXECUTABLE, "--json", "bulk"});
  EXPECT_EQ(json.status, 0);
  EXPECT_EQ(json.out, "{}\n");

  Program refused = Program::run({AXCTL_EXECUTABLE, "--protocol", "4", "bulk"});
  EXPECT_EQ(refused.status, 1);
  EXPECT_EQ(refused.err, "axctl: error 7: unsupported protocol version 4 (current 3)\n");

  Program refusedJson = Program::run({AXCTL_EXECUTABLE, "--json", "--protocol", "1", "bulk"});
  EXPECT_EQ(refusedJson.status, 1);
  EXPECT_NE(refusedJson.out.find("\"errorcode\": 7"), std::string::npos) << refusedJson.out;
}

TEST(Axctl, WithoutADaemonItFailsWithTheConnectionsCode) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  Program lonely = Program::run({AXCTL_EXECUTABLE, "bulk"});
  EXPECT_EQ(lonely.status, 1);
  EXPECT_EQ(lonely.err.rfind("axctl: error 4: Connection invalid", 0), 0u) << lonely.err;
}

TEST(Axctl, HelpNamesEveryRequestType) {
  Program help = Program::run({AXCTL_EXECUTABLE, "--help"});
  EXPECT_EQ(help.status, 0);
  for (const char* command :
       {"add", "remove", "bulk", "match", "ready", "access", "annotate", "hold", "release"}) {
    EXPECT_NE(help.out.find("\n  " + std::string(command) + " "), std::string::npos) << command;
  }
  Program badUuid = Program::run({AXCTL_EXECUTABLE, "ready", "not-a-uuid"});
  EXPECT_NE(badUuid.status, 0);
}

// A listening socket bound by the test, handed to the daemon as the service manager would.
TEST(SocketActivation, TheDaemonServesOnTheSocketItWasHanded) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  std::string path = root / "activated.sock";
  int listening = socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path.c_str());
  ASSERT_EQ(bind(listening, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(listen(listening, 8), 0);

  pid_t pid = fork();
  if (pid == 0) {
    dup2(listening, 3);
    setenv("LISTEN_PID", std::to_string(getpid()).c_str(), 1);
    setenv("LISTEN_FDS", "1", 1);
    execl(AXD_EXECUTABLE, AXD_EXECUTABLE, static_cast<char*>(nullptr));
    _exit(127);
  }
  close(listening);

  RawClient client(path);
  ASSERT_TRUE(client.connected());
  client.sendFrame(zyn::FrameKind::Request, 9,
                   value::Value::dictionary({{"request", value::Value::string("bulk")},
                                             {"version", value::Value::unsignedInteger(3)}}));
  auto reply = client.receive();
  ASSERT_TRUE(reply);
  EXPECT_EQ(reply->id, 9u);
  struct stat unused;
  EXPECT_NE(stat((os::Paths::zynSocketDir() + "/" + AXDaemonClient::defaultServiceName()).c_str(),
                 &unused),
            0)
      << "an activated daemon binds no socket of its own";
  kill(pid, SIGKILL);
  waitpid(pid, nullptr, 0);
}

}  // namespace
