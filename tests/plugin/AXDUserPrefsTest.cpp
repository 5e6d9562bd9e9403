#include <gtest/gtest.h>
#include <unistd.h>

#include "axd/AXDUserPrefs.h"
#include "platform/prefs/Preferences.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Value;

TEST(AXDUserPrefsTest, EveryCallSeesTheCurrentExclusions) {
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  const std::string domain = AXD_VENDOR_PREFIX ".annexa.userprefs";
  AXDUserPrefs userPrefs;
  EXPECT_EQ(userPrefs.exclusions(), std::nullopt);

  Value rules = Value::array({Value::dictionary({{"QSExtensionIdentifier", Value::string("a")}})});
  ASSERT_TRUE(prefs::Preferences::setValue("exclusions", rules, domain).ok());
  EXPECT_EQ(userPrefs.exclusions(), rules);
  // Another program empties the domain behind the daemon's back.
  root.write("var/users/" + std::to_string(geteuid()) + "/Preferences/" + domain + ".plist",
             "<plist version=\"1.0\"><dict/></plist>");
  EXPECT_EQ(userPrefs.exclusions(), std::nullopt);
}

}  // namespace
