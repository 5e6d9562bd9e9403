// An installer's journey through rgctl and the real daemon: an application with one broken
// plug-in is installed with the others, and rgctl says what it left out.

#include <string>
#include <vector>

#include "tests/e2e/Bundles.h"
#include "tests/e2e/DaemonTest.h"

namespace {

using value::Value;
using Ids = std::vector<std::string>;

TEST_F(DaemonTest, AnApplicationWithOneBrokenPlugInInstallsTheOthers) {
  ASSERT_TRUE(start());
  std::string app = root() + "/Applications/Suite.app";
  std::string one = bundles::plugIn(root() + "/Applications", "Suite", {.id = "suite.one"});
  std::string two = bundles::plugIn(root() + "/Applications", "Suite", {.id = "suite.two"});
  std::string broken = app + "/PlugIns/Broken.appex";
  bundles::writePlist(broken + "/Info.plist",
                      Value::dictionary({{"QFBundleIdentifier", Value::string("suite.broken")}}));

  Subprocess::Outcome installed = Subprocess::run(
      RGCTL_EXECUTABLE, {"--root", root(), "install", app}, {{"AXD_LOG", "stderr"}});
  EXPECT_EQ(installed.status, 0) << installed.err;
  EXPECT_EQ(installed.out, "ok\n");
  std::string reason =
      "not a plug-in bundle: the Info.plist of " + broken + " has no \"QSExtension\" dictionary";
  EXPECT_NE(installed.err.find("rgctl: left out " + broken + ": " + reason + "\n"),
            std::string::npos)
      << installed.err;
  EXPECT_NE(installed.err.find("registry: left " + broken + " out of " + app + ": " + reason),
            std::string::npos)
      << installed.err;

  EXPECT_EQ(matchIds(), (Ids{"suite.one", "suite.two"}));
  EXPECT_TRUE(record(one) && record(two));
  EXPECT_FALSE(record(broken));
}

}  // namespace
