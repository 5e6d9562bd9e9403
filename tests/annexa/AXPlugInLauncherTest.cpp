#include <gtest/gtest.h>

#include <cerrno>
#include <vector>

#include "Annexa/AXPlugInLauncher.h"
#include "platform/value/Value.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Dictionary;
using value::Value;

constexpr const char* kUuid = "0738CB01-5194-415E-ACDD-AD377007A11B";

Dictionary formWith(Value bundleInfo) {
  return Dictionary{{"uuid", Value::string(kUuid)}, {"bundleInfo", std::move(bundleInfo)}};
}

Value info(Value identifier, Value version) {
  return Value::dictionary(
      {{"QFBundleIdentifier", std::move(identifier)}, {"QFBundleShortVersionString", version}});
}

class AXPlugInLauncherTest : public ::testing::Test {
 protected:
  void SetUp() override { environment_.set("ANNEXA_ROOT", root_.path()); }

  TempDirectory root_;
  ScopedEnvironment environment_;
};

TEST_F(AXPlugInLauncherTest, RefusesAFormThatNamesNoService) {
  struct Case {
    const char* what;
    Dictionary form;
    const char* missing;
  };
  const Value s = Value::string("1.0");
  const std::vector<Case> cases = {
      {"no bundleInfo", Dictionary{{"uuid", Value::string(kUuid)}}, "\"bundleInfo\""},
      {"identifier a number", formWith(info(Value::integer(1), s)), "\"QFBundleIdentifier\""},
      {"version empty", formWith(info(Value::string("com.x.p"), Value::string(""))),
       "\"QFBundleShortVersionString\""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    os::Result<pid_t> launched = AXPlugInLauncher::launch(c.form);
    ASSERT_FALSE(launched.ok());
    EXPECT_EQ(launched.error().errnum, EINVAL);
    EXPECT_NE(launched.error().message.find(c.missing), std::string::npos)
        << launched.error().message;
    EXPECT_NE(launched.error().message.find(kUuid), std::string::npos) << launched.error().message;
  }
}

}  // namespace
