// Property lists that once ended the process inside libplist, met where the daemon and rgctl
// read files: a plug-in's Info.plist, an SDK, the entitlement table and the annotation file.

#include <filesystem>
#include <string>

#include "Annexa/AXProtocol.h"
#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"
#include "tests/platform/TempDirectory.h"

namespace {

namespace fs = std::filesystem;

// A binary property list whose dictionary key holds a NUL byte.
const fs::path kCrash = AXD_PLIST_CORPUS "/crash-nul-in-key.bin";

void plant(const fs::path& path) {
  fs::create_directories(path.parent_path());
  fs::copy_file(kCrash, path, fs::copy_options::overwrite_existing);
}

TEST_F(DaemonTest, APropertyListLibplistWouldAbortOnIsRefused) {
  TempDirectory home;
  ASSERT_TRUE(start({"-d", home / "Annotations"}));
  std::string good = bundles::plugIn(root() + "/Applications", "Notes", {.id = "crafted.good"});
  EXPECT_EQ(send(AXProtocol::kAdd, {good}), "ok");
  std::string bad = bundles::plugIn(root() + "/Applications", "Notes", {.id = "crafted.bad"});
  plant(bad + "/Info.plist");
  EXPECT_EQ(send(AXProtocol::kAdd, {bad}), "2: unable to register plug-in at " + bad);
  matchIds();
  expectServing();

  Subprocess::Outcome registered =
      Subprocess::run(RGCTL_EXECUTABLE, {"--root", root(), "register", bad});
  EXPECT_NE(registered.status, 0);
  EXPECT_NE(registered.err.find(bad), std::string::npos) << registered.err;

  // A registered plug-in whose Info.plist is swapped afterwards, and the files read at start-up.
  plant(good + "/Info.plist");
  plant(home / "Annotations");
  plant(root() + "/System/Library/SDKs/test.point.plist");
  plant(root() + "/etc/annexa/entitlements.d/crafted.plist");
  ASSERT_TRUE(restart());
  matchIds();
  expectServing();
}

}  // namespace
