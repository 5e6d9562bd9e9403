#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "Annexa/AXPlugInLauncher.h"
#include "platform/launcher/ServiceLauncher.h"
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

  // A plug-in stand-in that exits with status 7.
  std::string plugIn() const {
    std::string path = root_.write("plugin", "#!/bin/sh\nexit 7\n");
    chmod(path.c_str(), 0755);
    return path;
  }

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

TEST_F(AXPlugInLauncherTest, StartsOnlyWhatThisProcessWasMadeReadyFor) {
  const Dictionary form = formWith(info(Value::string("com.x.p"), Value::string("1.0")));
  os::Result<pid_t> nothingRecorded = AXPlugInLauncher::launch(form);
  ASSERT_FALSE(nothingRecorded.ok());
  EXPECT_EQ(nothingRecorded.error().errnum, EPERM);

  // Ready for another process (our parent) is not ready for this one.
  ASSERT_TRUE(
      launcher::ServiceLauncher::addService(getppid(), "com.x.p", "1.0", plugIn(), {}).ok());
  os::Result<pid_t> otherHost = AXPlugInLauncher::launch(form);
  ASSERT_FALSE(otherHost.ok());
  EXPECT_EQ(otherHost.error().errnum, EPERM);

  ASSERT_TRUE(launcher::ServiceLauncher::addService(getpid(), "com.x.p", "1.0", plugIn(), {}).ok());
  os::Result<pid_t> started = AXPlugInLauncher::launch(form);
  ASSERT_TRUE(started.ok()) << started.error().message;
  int status = 0;
  ASSERT_EQ(waitpid(started.value(), &status, 0), started.value());
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 7) << status;
}

}  // namespace
