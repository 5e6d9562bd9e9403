// What an ordinary client cannot do to the daemon or to other clients, tried as an attacker and
// as bad luck would: through the real daemon, with clients that misbehave or die at the worst
// moment.

#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "Annexa/AXProtocol.h"
#include "platform/registrum/Workspace.h"
#include "platform/value/PropertyList.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"

namespace {

using bundles::PlugInContents;
using value::Dictionary;
using value::Value;
using Ids = std::vector<std::string>;

class TrustTest : public DaemonTest {
 protected:
  std::string inApp(const std::string& app, const PlugInContents& contents) {
    return bundles::plugIn(root() + "/Applications", app, contents);
  }
};

TEST_F(TrustTest, AHostEntitlementDemandThatNamesNothingRefusesEveryHost) {
  ASSERT_TRUE(start());
  auto demanding = [&](const char* id, Value demand) {
    return inApp("Demands", {.id = id,
                             .extension = {{"QSExtensionHostEntitlement", demand}},
                             .executable = "/bin/sleep"});
  };
  std::vector<std::string> paths = {
      demanding("demand.number", Value::integer(1)),
      demanding("demand.array", Value::array({Value::string("x")})),
      demanding("demand.dictionary", Value::dictionary({{"x", Value::boolean(true)}})),
      demanding("demand.empty", Value::string("")),
      demanding("demand.named", Value::string("x")),
  };
  ASSERT_EQ(send(AXProtocol::kAdd, paths), "ok");
  // A host with every entitlement it could name still gets only the well-formed demand.
  grant({{"x", Value::boolean(true)}, {"1", Value::boolean(true)}});
  EXPECT_EQ(matchIds(), Ids{"demand.named"});
  EXPECT_EQ(send(AXProtocol::kReady, {uuid(paths[0])}),
            "11: access to plugin demand.number denied: the plug-in's host entitlement demand is "
            "malformed");
  EXPECT_EQ(send(AXProtocol::kReady, {uuid(paths[4])}), "ok");
  EXPECT_EQ(logCount("demands a malformed host entitlement"), 4u);
}

// A client that dies while its own lock request is worked: the hold it would have placed has no
// one left to release it, so it must not be placed.
TEST_F(TrustTest, AHoldNeverOutlivesTheClientThatAskedForIt) {
  ASSERT_TRUE(start({"-v"}));
  const std::string app = root() + "/Applications/Many.app";
  std::vector<std::string> ids;
  for (int i = 0; i < 200; ++i) {
    ids.push_back("many." + std::to_string(1000 + i));
    inApp("Many", {.id = ids.back()});
  }
  auto registry = registrum::Workspace::open(root());
  ASSERT_TRUE(registry.ok());
  ASSERT_TRUE(registry.value()->installApplication(app).ok());
  ASSERT_EQ(matchIds().size(), ids.size());

  for (int attempt = 0; attempt < 3; ++attempt) {
    std::unique_ptr<RawClient> dying = connectRaw();
    ASSERT_TRUE(dying);
    Dictionary lock{{AXProtocol::kRequest, Value::string(AXProtocol::kLock)},
                    {AXProtocol::kVersion, Value::unsignedInteger(AXProtocol::kCurrentVersion)},
                    {AXProtocol::kFlags, Value::unsignedInteger(AXProtocol::kHoldApplications)},
                    {AXProtocol::kPaths, Value::array({Value::string(app)})}};
    std::size_t seen = logCount("request lock");
    ASSERT_TRUE(dying->sendFrame(zyn::FrameKind::Request, 1, Value::dictionary(lock)));
    dying.reset();
    // Once the daemon works the lock, a later request waits for it on the service queue.
    for (int wait = 0; wait < 1000 && logCount("request lock") == seen; ++wait) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    EXPECT_EQ(matchIds().size(), ids.size()) << "attempt " << attempt;
  }
}

// Paths are taken as the file system reads them, and only the entitlement table's own files
// grant anything.
TEST_F(TrustTest, APathWithANulByteOrALinkedEntitlementFileIsRefused) {
  ASSERT_TRUE(start());
  std::string plugIn = inApp("Paths", {.id = "paths.one"});
  EXPECT_EQ(send(AXProtocol::kAdd, {plugIn + std::string(1, '\0') + "junk"}),
            "9: invalid path (NUL byte): " + plugIn + "?junk");
  EXPECT_EQ(matchIds(), Ids{});

  // A table file that is a symbolic link to a file elsewhere grants nothing.
  const std::string manager = AXD_VENDOR_PREFIX ".private.annexa.manager";
  grant({{manager, Value::boolean(true)}});
  std::string table = root() + "/etc/annexa/entitlements.d/e2e_tests.plist";
  std::string elsewhere = root() + "/grant.plist";
  std::filesystem::rename(table, elsewhere);
  std::filesystem::create_symlink(elsewhere, table);
  BlockingClient linked;
  auto request = linked.client().request(AXProtocol::kMatch);
  request[AXProtocol::kFlags] = Value::unsignedInteger(AXProtocol::AXDiscoverAll);
  EXPECT_EQ(linked.outcome(request), "11: unauthorized discovery flag (AXDiscoverAll)");
}

// What one client may cost the others: lists are bounded, and an oversized message costs one
// line of the log, not its size.
TEST_F(TrustTest, OneRequestCannotHoldTheDaemonOrFloodItsLog) {
  ASSERT_TRUE(start());
  std::vector<value::Uuid> many(AXProtocol::kMaxListLength + 1, value::Uuid::random());
  EXPECT_EQ(send(AXProtocol::kAccess, many),
            "4: invalid request format (4097 elements in \"uuids\", at most 4096)");
  many.pop_back();
  EXPECT_EQ(send(AXProtocol::kAccess, many), "4: no such plugin (uuid not found)");

  std::unique_ptr<RawClient> raw = connectRaw();
  ASSERT_TRUE(raw);
  ASSERT_TRUE(raw->sendFrame(zyn::FrameKind::OneWay, 1, Value::string(std::string(1 << 20, 'x'))));
  ASSERT_TRUE(daemon().waitForLog("bytes cut)"));
  expectServing();

  // A frame of one-byte items decodes to values some 32 times its size: refused, like a frame
  // over the limit, before it is built.
  std::unique_ptr<RawClient> dense = connectRaw();
  ASSERT_TRUE(dense);
  ASSERT_TRUE(dense->sendFrame(zyn::FrameKind::Request, 1,
                               Value::array(value::Array(100000, Value::unsignedInteger(0)))));
  EXPECT_TRUE(dense->closedByPeer());
  EXPECT_EQ(logCount("more than 25065 items"), 1u);
  expectServing();
  std::size_t longest = 0;
  std::string log = daemon().log();
  for (std::size_t start = 0, end; start < log.size(); start = end + 1) {
    end = log.find('\n', start);
    if (end == std::string::npos) end = log.size();
    longest = std::max(longest, end - start);
  }
  EXPECT_LT(longest, 9000u);
}

// What another local user may have put into the runtime directory is never used: a link where a
// notification belongs is not written through, and a directory others may write is refused.
TEST_F(TrustTest, PlantedRuntimeFilesAreNotUsed) {
  ASSERT_TRUE(start());
  std::string plugIn = inApp("Planted", {.id = "planted.tool", .executable = "/bin/sleep"});
  ASSERT_EQ(send(AXProtocol::kAdd, {plugIn}), "ok");
  std::string victim = root() + "/victim";
  bundles::writePlist(victim, Value::string("precious"));
  std::string notify = root() + "/run/notify";
  std::filesystem::create_directories(notify);
  std::filesystem::permissions(notify, std::filesystem::perms(0755));
  std::filesystem::create_symlink(victim,
                                  notify + "/" AXD_VENDOR_PREFIX ".annexa.annotation-change");

  auto annotate = client().client().request(AXProtocol::kAnnotate, {uuid(plugIn)}, 0);
  annotate[AXProtocol::kAnnotations] = Value::dictionary({{"election", Value::integer(1)}});
  EXPECT_EQ(client().outcome(annotate), "ok");
  EXPECT_EQ(value::PropertyList::readFile(victim).value(), Value::string("precious"));
  EXPECT_GE(logCount("unable to post"), 1u);

  std::string launcher = root() + "/run/launcher";
  std::filesystem::create_directories(launcher);
  std::filesystem::permissions(launcher, std::filesystem::perms(0777));
  EXPECT_EQ(send(AXProtocol::kReady, {uuid(plugIn)}).rfind("4: unable to enable plug-in", 0), 0u);
  EXPECT_EQ(logCount("refusing to use it"), 1u);
}

// A socket directory that others may write: another user could put a socket of theirs where
// clients look for the daemon's, so the daemon will not serve there.
TEST_F(TrustTest, TheDaemonRefusesASocketDirectoryOthersMayWrite) {
  TempDirectory root;
  std::string sockets = root / "run/zyn";
  std::filesystem::create_directories(sockets);
  std::filesystem::permissions(sockets, std::filesystem::perms(0777));
  Subprocess::Outcome outcome =
      Subprocess::run(AXD_EXECUTABLE, {}, {{"ANNEXA_ROOT", root.path()}, {"AXD_LOG", "stderr"}});
  EXPECT_NE(outcome.status, 0);
  EXPECT_NE(outcome.err.find(sockets + " is owned by uid " + std::to_string(geteuid()) +
                             " with mode 0777, not uid " + std::to_string(geteuid()) +
                             " with 0700: refusing to use it"),
            std::string::npos)
      << outcome.err;
  EXPECT_TRUE(std::filesystem::is_empty(sockets));
}

}  // namespace
