// axd's command line and start-up, axctl, and the trace probes of the axd binary.

#include <signal.h>
#include <spawn.h>
#include <stdio.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "platform/launcher/ServiceLauncher.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"
#include "tests/support/BlockingClient.h"

namespace {

constexpr const char* kUsage = "Usage: axd [-S servicename] [-v]\n";

TEST(AxdCommandLine, MisusePrintsTheUsageAndExitsWithStatus2) {
  // A root of its own, so that an axd that starts after all never touches the user's sockets.
  TempDirectory root;
  const std::vector<std::vector<std::string>> misuses = {
      {"stray"}, {"-v", "stray"}, {"-x"}, {"-S"}, {"-c"}, {"-S", "name", "-q"}};
  for (const auto& arguments : misuses) {
    SCOPED_TRACE(testing::PrintToString(arguments));
    Subprocess::Outcome outcome =
        Subprocess::run(AXD_EXECUTABLE, arguments, {{"ANNEXA_ROOT", root.path()}});
    EXPECT_EQ(outcome.status, 2);
    EXPECT_EQ(outcome.err, kUsage);
    EXPECT_EQ(outcome.out, "");
  }
}

TEST_F(DaemonTest, ACacheLimitThatIsNoNumberStillServes) {
  ASSERT_TRUE(start({"-c", "notanumber"}));
  expectServing();
}

TEST_F(DaemonTest, DashSNamesTheService) {
  ASSERT_TRUE(start({"-S", "other.name"}, "other.name"));
  EXPECT_TRUE(std::filesystem::exists(daemon().root() + "/run/zyn/other.name"));
  EXPECT_FALSE(std::filesystem::exists(DaemonProcess::socketPath()));
  expectServing();
  EXPECT_EQ(BlockingClient().bulk(0).substr(0, 14), "service error:");
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
  ASSERT_TRUE(start({"-v"}));
  Subprocess::Outcome ok = axctl({"bulk", "--flags", "0x5"});
  EXPECT_EQ(ok.status, 0) << ok.err;
  EXPECT_EQ(ok.out, "ok\n");
  EXPECT_EQ(logCount("bulk options 0x5 not supported"), 1u);

  Subprocess::Outcome refused = axctl({"--protocol", "4", "bulk"});
  EXPECT_EQ(refused.status, 1);
  EXPECT_EQ(refused.err, "axctl: error 7: unsupported protocol version 4 (current 3)\n");

  Subprocess::Outcome json = axctl({"--json", "bulk"});
  EXPECT_EQ(json.status, 0) << json.err;
  EXPECT_EQ(json.out, "{}\n");

  Subprocess::Outcome jsonRefused = axctl({"--json", "--protocol", "1", "bulk"});
  EXPECT_EQ(jsonRefused.status, 1);
  EXPECT_TRUE(jsonRefused.out.starts_with("{")) << jsonRefused.out;
  EXPECT_NE(jsonRefused.out.find("\"errorcode\": 7"), std::string::npos) << jsonRefused.out;

  // A malformed argument is refused before anything is sent.
  EXPECT_NE(axctl({"ready", "not-a-uuid"}).status, 0);
  EXPECT_NE(axctl({"release", "not-a-uuid"}).status, 0);
  EXPECT_EQ(logCount(" request ready"), 0u);
  EXPECT_EQ(logCount(" request lock"), 0u);
}

TEST(Axctl, WithoutADaemonFailsWithCode4) {
  TempDirectory root;
  Subprocess::Outcome outcome =
      Subprocess::run(AXCTL_EXECUTABLE, {"bulk"}, {{"ANNEXA_ROOT", root.path()}});
  EXPECT_EQ(outcome.status, 1);
  EXPECT_TRUE(outcome.err.starts_with("axctl: error 4: Connection invalid")) << outcome.err;
}

TEST(Axctl, RefusesMalformedRulesFlagsAndExtensionsBeforeConnecting) {
  TempDirectory root;
  const std::string uuid = "12345678-1234-1234-1234-123456789ABC";
  struct Case {
    std::vector<std::string> arguments;
    std::string error;  // empty: accepted, so the missing daemon is reached
  };
  const std::vector<Case> cases = {
      {{"match", "--rule", "[1]"}, "--rule: not a JSON object (array)"},
      {{"match", "{\"a\":"}, "RULE: not valid JSON"},
      {{"match", "--rule", R"({"a":{"b":[true,null]}})"}, "null at /a/b/1"},
      {{"match", "--rule", R"({"a":{"b":1,"b":2}})"}, "key \"b\" repeated"},
      {{"match", "--rule", R"({"a":"x"})", "a=true"}, "key \"a\" given twice"},
      {{"match", "=x"}, "not KEY=PATTERN"},
      {{"match", "--flag", "newest"}, "newest not in {all,all-copies,all-versions,system-only}"},
      {{"launch", "not-a-uuid"}, "not a UUID: not-a-uuid"},
      {{"launch", "--no-wait", uuid + "0"}, "not a UUID"},
      {{"annotate", "--extension", "\"x\"", uuid}, "--extension: not a JSON object (string)"},
      {{"match", "--flag", "all", "--rule", R"({"a":["x",1.5]})", R"({"b":{}})", "c=false"}, ""},
      {{"annotate", "--election", "1", "--extension", R"({"k":[1]})", uuid}, ""},
      {{"launch", "--no-wait", uuid}, ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(testing::PrintToString(c.arguments));
    Subprocess::Outcome outcome =
        Subprocess::run(AXCTL_EXECUTABLE, c.arguments, {{"ANNEXA_ROOT", root.path()}});
    if (c.error.empty()) {
      EXPECT_TRUE(outcome.err.starts_with("axctl: error 4: Connection invalid")) << outcome.err;
      continue;
    }
    EXPECT_NE(outcome.status, 0);
    EXPECT_NE(outcome.err.find(c.error), std::string::npos) << outcome.err;
    EXPECT_EQ(outcome.err.find("axctl: error"), std::string::npos) << outcome.err;
  }
}

TEST(Axctl, HelpNamesEveryCommand) {
  Subprocess::Outcome help = Subprocess::run(AXCTL_EXECUTABLE, {"--help"});
  EXPECT_EQ(help.status, 0);
  // Each command opens a line of the help's command list.
  std::set<std::string> listed;
  std::istringstream lines(help.out);
  for (std::string line; std::getline(lines, line);) {
    std::istringstream words(line);
    std::string first;
    if (line.starts_with("  ") && words >> first) listed.insert(first);
  }
  for (const char* command : {"add", "remove", "bulk", "match", "ready", "access", "annotate",
                              "hold", "release", "launch", "services", "watch"}) {
    EXPECT_TRUE(listed.count(command)) << command << " is missing from:\n" << help.out;
  }
}

TEST(Axctl, ServicesPrintsTheLauncherTableWithoutADaemon) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  const std::string header =
      "HOST     IDENTIFIER                               VERSION    PROFILE          EXECUTABLE\n";
  Subprocess::Outcome empty = Subprocess::run(AXCTL_EXECUTABLE, {"services"});
  EXPECT_EQ(empty.status, 0) << empty.err;
  EXPECT_EQ(empty.out, header);
  EXPECT_EQ(Subprocess::run(AXCTL_EXECUTABLE, {"--json", "services"}).out, "[]\n");

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
  EXPECT_EQ(listed.out, header + rows);
  Subprocess::Outcome json = Subprocess::run(AXCTL_EXECUTABLE, {"--json", "services"});
  EXPECT_NE(json.out.find("\"host\": " + std::to_string(getpid())), std::string::npos) << json.out;
  EXPECT_NE(json.out.find("\"_SandboxProfile\": \"kbd\""), std::string::npos) << json.out;
}

// The names of the probes of provider axd that readelf lists in |binary|'s notes.
std::set<std::string> axdProbesIn(const std::string& binary) {
  std::set<std::string> names;
  FILE* pipe = popen(("readelf -n '" + binary + "' 2>/dev/null").c_str(), "r");
  if (!pipe) return names;
  std::string provider;
  char buffer[512];
  while (fgets(buffer, sizeof buffer, pipe)) {
    std::istringstream words(buffer);
    std::string key, value;
    words >> key >> value;
    if (key == "Provider:") provider = value;
    if (key == "Name:" && provider == "axd") names.insert(value);
  }
  pclose(pipe);
  return names;
}

TEST(AxdBinary, CarriesTheTenTraceProbesOfProviderAxd) {
#if !defined(AXD_HAVE_SDT)
  GTEST_SKIP() << "built without trace probes";
#else
  if (std::system("readelf --version >/dev/null 2>&1") != 0) GTEST_SKIP() << "no readelf";
  const std::set<std::string> expected = {
      "client__new",   "client__done", "request__input", "request",       "request__output",
      "discover__raw", "plugin__add",  "plugin__remove", "plugin__ready", "db__load"};
  EXPECT_EQ(axdProbesIn(AXD_EXECUTABLE), expected);
#endif
}

}  // namespace
