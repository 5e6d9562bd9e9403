// axd's command line and start-up, and axctl's own work: its arguments and output.

#include <signal.h>
#include <spawn.h>
#include <stdio.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/launcher/ServiceLauncher.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

constexpr const char* kUsage = "Usage: axd [-S servicename] [-v]\n";

TEST(AxdCommandLine, MisusePrintsTheUsageAndExitsWithStatus2) {
  // A root of its own, so that an axd that starts after all never touches the user's sockets.
  TempDirectory root;
  const std::vector<std::vector<std::string>> misuses = {{"-v", "stray"}, {"-x"}, {"-S"}};
  for (const auto& arguments : misuses) {
    SCOPED_TRACE(testing::PrintToString(arguments));
    Subprocess::Outcome outcome =
        Subprocess::run(AXD_EXECUTABLE, arguments, {{"ANNEXA_ROOT", root.path()}});
    EXPECT_EQ(outcome.status, 2);
    EXPECT_EQ(outcome.err, kUsage);
    EXPECT_EQ(outcome.out, "");
  }
}

TEST_F(DaemonTest, DashSNamesTheServiceAndACacheLimitThatIsNoNumberStillServes) {
  ASSERT_TRUE(start({"-S", "other.name", "-c", "notanumber"}, "other.name"));
  EXPECT_TRUE(std::filesystem::exists(daemon().root() + "/run/zyn/other.name"));
  EXPECT_FALSE(std::filesystem::exists(DaemonProcess::socketPath()));
  expectServing();
  EXPECT_EQ(BlockingClient().bulk(0).substr(0, 14), "service error:");
}

TEST_F(DaemonTest, EachVerboseFlagAddsALevelOfLogging) {
  struct Level {
    std::vector<std::string> arguments;
    bool debugLines;
    bool wholeMessages;
  };
  const std::vector<Level> levels = {
      {{}, false, false}, {{"-v"}, true, false}, {{"-vvv"}, true, true}};
  for (const Level& level : levels) {
    SCOPED_TRACE(testing::PrintToString(level.arguments));
    ASSERT_TRUE(start(level.arguments));
    AXDaemonClient::Request marked = client().client().request(AXProtocol::kBulk);
    marked["marker"] = value::Value::string("e2e-marker-7f3a");
    EXPECT_EQ(client().outcome(marked), "ok");
    client().client().setProtocolVersion(9);
    EXPECT_EQ(client().bulk(0), "7: unsupported protocol version 9 (current 3)");

    EXPECT_EQ(logCount(thisClient() + " request bulk") > 0, level.debugLines);
    EXPECT_EQ(logCount("\"e2e-marker-7f3a\"") > 0, level.wholeMessages);
    EXPECT_EQ(logCount("Replying ") > 0, level.wholeMessages);
  }
}

TEST_F(DaemonTest, ASecondDaemonForAServedNameDoesNotStart) {
  ASSERT_TRUE(start());
  Subprocess::Outcome second = Subprocess::run(
      AXD_EXECUTABLE, {}, {{"ANNEXA_ROOT", daemon().root()}, {"AXD_LOG", "stderr"}});
  EXPECT_EQ(second.status, 1);
  EXPECT_NE(second.err.find("unable to construct server"), std::string::npos) << second.err;
  expectServing();
}

// A listening Unix socket at |path|; -1 when it cannot be made.
int listeningSocket(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  if (path.size() >= sizeof address.sun_path) return -1;
  std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
  int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd >= 0 && bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
      listen(fd, 8) == 0) {
    return fd;
  }
  if (fd >= 0) close(fd);
  return -1;
}

TEST(AxdStartUp, ServesOnTheListeningSocketAServiceManagerHandsOver) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  environment.set("LISTEN_FDS", "1");
  const std::string path = root / "activated.sock";
  int listening = listeningSocket(path);
  ASSERT_GE(listening, 0);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, listening, 3);
  // The shell's pid stays the daemon's through exec, and LISTEN_PID must name the daemon.
  const char* argv[] = {"/bin/sh", "-c", "LISTEN_PID=$$ exec \"$0\"", AXD_EXECUTABLE, nullptr};
  pid_t pid = 0;
  int failed = posix_spawn(&pid, argv[0], &actions, nullptr, const_cast<char**>(argv), environ);
  posix_spawn_file_actions_destroy(&actions);
  close(listening);
  ASSERT_EQ(failed, 0);
  struct Reaper {
    pid_t pid;
    ~Reaper() {
      kill(pid, SIGKILL);
      waitpid(pid, nullptr, 0);
    }
  } reaper{pid};

  auto raw = RawClient::connect(path);
  ASSERT_TRUE(raw.ok()) << raw.error().message;
  EXPECT_EQ(raw.value()->request(9, RawClient::bulkRequest(0)), "ok");
  EXPECT_FALSE(std::filesystem::exists(DaemonProcess::socketPath()))
      << "a daemon handed its socket binds none of its own";
}

TEST_F(DaemonTest, AxctlSendsARequestAndReportsItsReply) {
  ASSERT_TRUE(start());
  Subprocess::Outcome ok = axctl({"bulk", "--flags", "0x5"});
  EXPECT_EQ(ok.status, 0) << ok.err;
  EXPECT_EQ(ok.out, "ok\n");
  EXPECT_EQ(logCount("bulk options 0x5 not supported"), 1u);
  EXPECT_EQ(axctl({"--json", "bulk"}).out, "{}\n");

  Subprocess::Outcome refused = axctl({"--protocol", "4", "bulk"});
  EXPECT_EQ(refused.status, 1);
  EXPECT_EQ(refused.err, "axctl: error 7: unsupported protocol version 4 (current 3)\n");
  Subprocess::Outcome jsonRefused = axctl({"--json", "--protocol", "1", "bulk"});
  EXPECT_EQ(jsonRefused.status, 1);
  EXPECT_NE(jsonRefused.out.find("\"errorcode\": 7"), std::string::npos) << jsonRefused.out;
}

TEST(Axctl, RefusesMalformedArgumentsBeforeConnecting) {
  TempDirectory root;
  const std::string uuid = "12345678-1234-1234-1234-123456789ABC";
  struct Case {
    std::vector<std::string> arguments;
    std::string error;  // empty: accepted, so the missing daemon is reached
  };
  const std::vector<Case> cases = {
      {{"match", "--rule", R"({"a":{"b":1,"b":2}})"}, "key \"b\" repeated"},
      {{"match", "=x"}, "not KEY=PATTERN"},
      {{"ready", "not-a-uuid"}, "not a UUID: not-a-uuid"},
      {{"match", "--flag", "all", "--rule", R"({"a":["x",1.5]})", R"({"b":{}})", "c=false"}, ""},
      {{"annotate", "--election", "1", "--extension", R"({"k":[1]})", uuid}, ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.arguments));
    Subprocess::Outcome outcome =
        Subprocess::run(AXCTL_EXECUTABLE, c.arguments, {{"ANNEXA_ROOT", root.path()}});
    EXPECT_NE(outcome.status, 0);
    if (c.error.empty()) {
      EXPECT_TRUE(outcome.err.starts_with("axctl: error 4: Connection invalid")) << outcome.err;
      continue;
    }
    EXPECT_NE(outcome.err.find(c.error), std::string::npos) << outcome.err;
    EXPECT_EQ(outcome.err.find("axctl: error"), std::string::npos) << outcome.err;
  }
}

TEST(Axctl, ServicesPrintsTheLauncherTableWithoutADaemon) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  const value::Dictionary description{
      {"ZynService", value::Value::dictionary({{"_SandboxProfile", value::Value::string("kbd")}})}};
  ASSERT_TRUE(
      launcher::ServiceLauncher::addService(getpid(), "com.x.p", "2.1", "/bin/true", description)
          .ok());
  ASSERT_TRUE(
      launcher::ServiceLauncher::addService(getpid(), "com.x.q", "1", "/bin/true", {}).ok());
  Subprocess::Outcome listed = Subprocess::run(AXCTL_EXECUTABLE, {"services"});
  EXPECT_EQ(listed.status, 0) << listed.err;
  char rows[256];
  std::snprintf(rows, sizeof rows, "%-8d %-40s %-10s %-16s %s\n%-8d %-40s %-10s %-16s %s\n",
                getpid(), "com.x.p", "2.1", "kbd", "/bin/true", getpid(), "com.x.q", "1", "-",
                "/bin/true");
  EXPECT_EQ(listed.out,
            "HOST     IDENTIFIER                               VERSION    PROFILE          "
            "EXECUTABLE\n" +
                std::string(rows));
  Subprocess::Outcome json = Subprocess::run(AXCTL_EXECUTABLE, {"--json", "services"});
  EXPECT_NE(json.out.find("\"_SandboxProfile\": \"kbd\""), std::string::npos) << json.out;
}

}  // namespace
