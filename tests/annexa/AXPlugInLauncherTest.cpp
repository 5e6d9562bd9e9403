#include <gtest/gtest.h>

#include <cerrno>

#include "Annexa/AXPlugInLauncher.h"
#include "platform/value/Value.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using value::Dictionary;
using value::Value;

TEST(AXPlugInLauncherTest, RefusesAFormThatNamesNoService) {
  // A device root of its own, should a refusal ever reach the launcher.
  TempDirectory root;
  ScopedEnvironment environment;
  environment.set("ANNEXA_ROOT", root.path());
  const std::string uuid = "0738CB01-5194-415E-ACDD-AD377007A11B";
  auto withInfo = [&](Value identifier, Value version) {
    return Dictionary{{"uuid", Value::string(uuid)},
                      {"bundleInfo", Value::dictionary({{"QFBundleIdentifier", identifier},
                                                        {"QFBundleShortVersionString", version}})}};
  };
  const struct {
    Dictionary form;
    const char* missing;
  } cases[] = {
      {Dictionary{{"uuid", Value::string(uuid)}}, "\"bundleInfo\""},
      {withInfo(Value::integer(1), Value::string("1.0")), "\"QFBundleIdentifier\""},
      {withInfo(Value::string("com.x.p"), Value::string("")), "\"QFBundleShortVersionString\""},
  };
  for (const auto& c : cases) {
    os::Result<pid_t> launched = AXPlugInLauncher::launch(c.form);
    ASSERT_FALSE(launched.ok()) << c.missing;
    EXPECT_EQ(launched.error().errnum, EINVAL);
    EXPECT_NE(launched.error().message.find(c.missing), std::string::npos)
        << launched.error().message;
    EXPECT_NE(launched.error().message.find(uuid), std::string::npos) << launched.error().message;
  }
}

}  // namespace
