// Discovery through the real daemon: which plug-ins a match request returns to which client
// process. How records of one identifier collapse, the rule language and the host policy are
// tested in-process.

#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/prefs/Preferences.h"
#include "platform/sandbox/BootKey.h"
#include "platform/sandbox/Sandbox.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using bundles::PlugInContents;
using value::Dictionary;
using value::Value;

const std::string kManager = AXD_VENDOR_PREFIX ".private.annexa.manager";
const std::string kUserPrefs = AXD_VENDOR_PREFIX ".annexa.userprefs";
const std::string kUnauthorized = "11: unauthorized discovery flag (AXDiscoverAll)";
constexpr std::uint64_t kAll = AXProtocol::AXDiscoverAll;
using Ids = std::vector<std::string>;

// True when the table that "axctl match" prints lists |id|.
bool lists(const std::string& table, const std::string& id) {
  std::istringstream lines(table);
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind(id + " ", 0) == 0) return true;
  }
  return false;
}

// True when every thread of process |pid| is traced.
bool traced(pid_t pid) {
  std::string tasks = "/proc/" + std::to_string(pid) + "/task";
  for (const auto& task : std::filesystem::directory_iterator(tasks)) {
    std::ifstream status(task.path() / "status");
    for (std::string line; std::getline(status, line);) {
      if (line.rfind("TracerPid:", 0) == 0 && std::stoi(line.substr(10)) == 0) return false;
    }
  }
  return true;
}

// The system calls that every thread of process |pid| makes while |work| runs, counted by
// strace; -1 when strace cannot attach (not installed, or tracing is not permitted here).
long systemCallsDuring(pid_t pid, const std::function<void()>& work) {
  std::string report =
      std::filesystem::temp_directory_path() / ("axd-strace-" + std::to_string(getpid()) + ".txt");
  std::string target = std::to_string(pid);
  // Quiet, following every thread, counting calls into |report|.
  std::vector<const char*> argv{"strace", "-q", "-f", "-c", "-o"};
  argv.insert(argv.end(), {report.c_str(), "-p", target.c_str(), nullptr});
  pid_t tracer = 0;
  if (posix_spawnp(&tracer, "strace", nullptr, nullptr, const_cast<char**>(argv.data()), environ) !=
      0) {
    return -1;
  }
  auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  while (!traced(pid) && waitpid(tracer, nullptr, WNOHANG) == 0 &&
         std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  bool attached = traced(pid);
  if (attached) work();
  kill(tracer, SIGINT);
  waitpid(tracer, nullptr, 0);
  std::ifstream summary(report);
  long calls = -1;
  // The last line: "100.00  <seconds>  <usecs/call>  <calls>  [<errors>]  total".
  for (std::string line; std::getline(summary, line);) {
    std::istringstream words(line);
    std::vector<std::string> fields{std::istream_iterator<std::string>(words), {}};
    if (attached && fields.size() >= 5 && fields.back() == "total") calls = std::stol(fields[3]);
  }
  std::filesystem::remove(report);
  return calls;
}

class DiscoveryTest : public DaemonTest {
 protected:
  void SetUp() override { ASSERT_TRUE(start()); }

  // A plug-in in the application "<root>/<app>.app"; returns its path.
  std::string inApp(const std::string& app, const PlugInContents& contents) {
    return bundles::plugIn(root(), app, contents);
  }
  void add(const std::vector<std::string>& paths) {
    ASSERT_EQ(send(AXProtocol::kAdd, paths), "ok");
  }
  std::string matchOutcome(const std::optional<Value>& rules, std::uint64_t flags) {
    auto request = client().client().request(AXProtocol::kMatch);
    if (rules) request[AXProtocol::kRules] = *rules;
    request[AXProtocol::kFlags] = Value::unsignedInteger(flags);
    return client().outcome(request);
  }
};

TEST_F(DiscoveryTest, TheFlagsDecideWhichVersionsAndCopiesOfOneIdentifierComeBack) {
  std::string newer = inApp("Two", {.id = "dup", .version = "1.10"});
  add({inApp("One", {.id = "dup", .version = "1.9"}), newer, inApp("One", {.id = "same"}),
       inApp("Two", {.id = "same"})});
  value::Array forms = match(Value::dictionary({{"QSExtensionIdentifier", Value::string("dup")}}));
  ASSERT_EQ(forms.size(), 1u);
  EXPECT_EQ(*forms[0].asDictionary()->find("path"), Value::string(newer));
  EXPECT_EQ(matchIds(), (Ids{"dup", "same"}));
  EXPECT_EQ(matchIds(std::nullopt, AXProtocol::kDiscoverAllVersions), (Ids{"dup", "dup", "same"}));
  EXPECT_EQ(
      matchIds(std::nullopt, AXProtocol::kDiscoverAllVersions | AXProtocol::kDiscoverAllCopies),
      (Ids{"dup", "dup", "same", "same"}));
}

TEST_F(DiscoveryTest, VisibilityFollowsTheClientsApplicationEntitlementsAndFlags) {
  std::string hostAxctl = bundles::hostApplication(root() + "/Host.app", AXCTL_EXECUTABLE);
  std::string otherAxctl = bundles::hostApplication(root() + "/Other.app", AXCTL_EXECUTABLE);
  const Dictionary dedicated{{"Dedicated", Value::boolean(true)}};
  // Beside the host's plug-ins folder, in one whose name starts like it: not the host's own.
  std::string beside = bundles::writePlugIn(root() + "/Host.app/PlugInsOld/vis.beside.appex",
                                            {.id = "vis.beside", .extension = dedicated});
  add({inApp("Host", {.id = "vis.dedicated", .extension = dedicated}), beside,
       inApp("Other", {.id = "vis.app"}),
       bundles::writePlugIn(root() + "/System/Library/PlugIns/vis.system.appex",
                            {.id = "vis.system"}),
       inApp("Other", {.id = "vis.guarded",
                       .extension = {{"QSExtensionHostEntitlement", Value::string("x")}}})});

  EXPECT_EQ(matchIds(), (Ids{"vis.app", "vis.system"}));  // this program has no application
  EXPECT_EQ(matchIds(std::nullopt, AXProtocol::kDiscoverSystemOnly), Ids{"vis.system"});
  Subprocess::Outcome fromHost = Subprocess::run(hostAxctl, {"match"});
  ASSERT_EQ(fromHost.status, 0) << fromHost.err;
  EXPECT_TRUE(lists(fromHost.out, "vis.dedicated")) << fromHost.out;
  EXPECT_FALSE(lists(fromHost.out, "vis.beside")) << fromHost.out;
  Subprocess::Outcome fromOther = Subprocess::run(otherAxctl, {"match"});
  ASSERT_EQ(fromOther.status, 0) << fromOther.err;
  EXPECT_FALSE(lists(fromOther.out, "vis.dedicated")) << fromOther.out;
  EXPECT_TRUE(lists(fromOther.out, "vis.app")) << fromOther.out;

  // The host policy applies the entitlements that the table grants this program.
  grant({{"x", Value::boolean(true)}});
  EXPECT_EQ(matchIds(), (Ids{"vis.app", "vis.guarded", "vis.system"}));
  // Discovering everything lifts the application, system-only and policy filters.
  EXPECT_EQ(matchOutcome(std::nullopt, kAll), kUnauthorized);
  grant({{kManager, Value::boolean(true)}});
  EXPECT_EQ(matchIds(std::nullopt, kAll | AXProtocol::kDiscoverSystemOnly),
            (Ids{"vis.app", "vis.beside", "vis.dedicated", "vis.guarded", "vis.system"}));
}

TEST_F(DiscoveryTest, DiscoveringEverythingIsRefusedToASandboxedManager) {
  add({inApp("One", {.id = "any.plugin"})});
  bundles::grantProgram(root(), "axctl", AXCTL_EXECUTABLE, {{kManager, Value::boolean(true)}});
  Subprocess::Outcome plain = axctl({"match", "--flags", "512"});
  ASSERT_EQ(plain.status, 0) << plain.err;
  EXPECT_TRUE(lists(plain.out, "any.plugin")) << plain.out;

  Subprocess::Outcome sandboxed = Subprocess::run(AXCTL_EXECUTABLE, {"match", "--flags", "512"},
                                                  {{"ANNEXA_ROOT", root()}}, true);
  if (sandboxed.status == Subprocess::kNoSeccomp) GTEST_SKIP() << "no seccomp filters here";
  EXPECT_EQ(sandboxed.status, 1);
  EXPECT_NE(sandboxed.err.find("error " + kUnauthorized), std::string::npos) << sandboxed.err;
  // The refusal concerns the flag only: the same client may discover what it may see.
  Subprocess::Outcome ordinary =
      Subprocess::run(AXCTL_EXECUTABLE, {"match"}, {{"ANNEXA_ROOT", root()}}, true);
  EXPECT_TRUE(lists(ordinary.out, "any.plugin")) << ordinary.err;
}

TEST_F(DiscoveryTest, UserExclusionsCountFromTheNextRequestEvenForDiscoverAll) {
  add({inApp("One", {.id = "ex.keep"}), inApp("One", {.id = "ex.drop"})});
  grant({{kManager, Value::boolean(true)}});
  ASSERT_EQ(matchIds(), (Ids{"ex.drop", "ex.keep"}));
  // An element that is no rule excludes nothing.
  Value exclusions =
      Value::array({Value::string("junk"),
                    Value::dictionary({{"QSExtensionIdentifier", Value::string("ex.drop")}})});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", exclusions, kUserPrefs).ok());
  EXPECT_EQ(matchIds(), Ids{"ex.keep"});
  EXPECT_EQ(matchIds(std::nullopt, kAll), Ids{"ex.keep"});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", std::nullopt, kUserPrefs).ok());
  EXPECT_EQ(matchIds(), (Ids{"ex.drop", "ex.keep"}));
}

// Once every record is cached, a discovery costs a fixed number of system calls, whatever the
// number of plug-ins: paths are resolved when a record is built and the key that signs the read
// extensions is read once per request.
TEST_F(DiscoveryTest, AWarmDiscoveryMakesNoSystemCallPerPlugIn) {
  constexpr std::size_t kPlugIns = 300;
  std::vector<std::string> paths;
  for (std::size_t i = 0; i < kPlugIns; ++i) {
    paths.push_back(inApp("Many", {.id = "many." + std::to_string(i),
                                   .extension = {{"Shared", Value::string(".")}}}));
  }
  add(paths);
  value::Array warm = match();
  ASSERT_EQ(warm.size(), kPlugIns);
  ASSERT_TRUE(warm[0].asDictionary()->find("extensions")->asDictionary()->find("."));
  std::size_t found = 0;
  long calls = systemCallsDuring(daemon().pid(), [&] { found = match().size(); });
  if (calls < 0) GTEST_SKIP() << "strace cannot trace the daemon here";
  EXPECT_EQ(found, kPlugIns);
  EXPECT_LT(calls, static_cast<long>(kPlugIns) / 3);
}

// The boot key is read for every discovery: a key made anew (the file removed, as at a reboot)
// signs the very next reply's tokens, and the old tokens no longer open.
TEST_F(DiscoveryTest, ANewBootKeySignsTheNextDiscoverysTokens) {
  add({inApp("Keyed", {.id = "keyed.tool", .extension = {{"Shared", Value::string(".")}}})});
  auto token = [&] {
    value::Array forms = match();
    const Value* extensions = forms.empty() ? nullptr : forms[0].asDictionary()->find("extensions");
    const Value* bundle = extensions ? extensions->asDictionary()->find(".") : nullptr;
    return bundle && bundle->asString() ? *bundle->asString() : std::string();
  };
  std::string before = token();
  ASSERT_TRUE(sandbox::Sandbox::consume(before).ok());
  std::filesystem::remove(sandbox::BootKey::path());
  std::string after = token();
  EXPECT_TRUE(sandbox::Sandbox::consume(after).ok());
  EXPECT_EQ(sandbox::Sandbox::consume(before).error().errnum, EPERM);
}

// A daemon started on installed plug-ins builds their records before it listens; the first
// discovery by an extension point takes its plug-ins from those records, and an install after
// that counts at the next discovery.
TEST_F(DiscoveryTest, TheRecordsBuiltAtStartServeTheFirstDiscoveryAndAnInstallCountsNext) {
  auto at = [](const char* point) {
    return Dictionary{{"QSExtensionPointIdentifier", Value::string(point)}};
  };
  add({inApp("Points", {.id = "a.one", .extension = at("point.a")}),
       inApp("Points", {.id = "b.one", .extension = at("point.b")})});
  ASSERT_TRUE(restart());
  EXPECT_EQ(logCount("built 2 plug-in records"), 1u);
  const Value pointA = Value::dictionary(at("point.a"));
  EXPECT_EQ(matchIds(pointA), Ids{"a.one"});
  add({inApp("Later", {.id = "a.two", .extension = at("point.a")})});
  EXPECT_EQ(matchIds(pointA), (Ids{"a.one", "a.two"}));
  EXPECT_EQ(matchIds(Value::dictionary(at("point.b"))), Ids{"b.one"});
}

TEST_F(DiscoveryTest, BadRulesAreRefusedAndProtocolVersionTwoGetsNoMatches) {
  add({inApp("One", {.id = "v2.plugin"})});
  EXPECT_EQ(matchOutcome(Value::string("QSExtensionIdentifier"), 0),
            "4: invalid request format (bad rules dictionary)");
  ASSERT_EQ(matchIds(), Ids{"v2.plugin"});
  client().client().setProtocolVersion(AXProtocol::kPreviousVersion);
  EXPECT_EQ(matchOutcome(std::nullopt, 0), "ok");
}

}  // namespace
