#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <filesystem>

#include "ScopedEnvironment.h"
#include "TempDirectory.h"
#include "platform/prefs/Preferences.h"
#include "tests/annexa/LogCapture.h"

namespace {

using prefs::Preferences;
using value::Value;

std::string plist(const std::string& body) {
  return "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">" + body +
         "</plist>\n";
}

class PreferencesTest : public ::testing::Test {
 protected:
  void SetUp() override {
    environment_.set("ANNEXA_ROOT", root_.path());
    std::filesystem::create_directories(root_ / directory_);
  }

  // Writes the domain "d" as another program would: in place, or renamed over the old file.
  void writeDomain(const std::string& body, bool inPlace) const {
    if (inPlace) {
      root_.write(directory_ + "/d.plist", plist(body));
      return;
    }
    root_.write(directory_ + "/new", plist(body));
    ASSERT_EQ(std::rename((root_ / directory_ + "/new").c_str(),
                          (root_ / directory_ + "/d.plist").c_str()),
              0);
  }

  static std::optional<Value> k() { return Preferences::copyValue("k", "d"); }

  TempDirectory root_;
  ScopedEnvironment environment_;
  const std::string directory_ = "var/users/" + std::to_string(geteuid()) + "/Preferences";
};

TEST_F(PreferencesTest, BrokenFilesReadAsNothingAndAreLoggedOncePerChange) {
  for (const std::string& body : {std::string("<dict><key>k</key>"), std::string("<array/>")}) {
    writeDomain(body, true);
    LogCapture log;
    ASSERT_TRUE(Preferences::synchronize("d").ok());
    ASSERT_TRUE(Preferences::synchronize("d").ok());
    EXPECT_EQ(k(), std::nullopt) << body;
    std::string text = log.text();
    EXPECT_NE(text.find("d.plist"), std::string::npos) << body;
    EXPECT_EQ(text.find("d.plist"), text.rfind("d.plist")) << text;
    // A writer refuses to replace what it cannot read, and leaves it as it is.
    EXPECT_EQ(Preferences::setValue("k", Value::integer(1), "d").error().errnum, EINVAL);
  }
  EXPECT_EQ(Preferences::setValue("k", Value(), "e").error().errnum, EINVAL);  // Null.
  writeDomain("<dict><key>k</key><true/><key>j</key><true/></dict>", false);
  ASSERT_TRUE(Preferences::setValue("j", std::nullopt, "d").ok());
  EXPECT_EQ(k(), Value::boolean(true));
  EXPECT_EQ(Preferences::copyValue("j", "d"), std::nullopt);
}

// A writer whose disk refuses part of the new file (a file-size limit, as a full file system would)
// is told, and the domain still reads as it was.
TEST_F(PreferencesTest, AWriteCutShortIsReportedAndTheOldDomainStillLoads) {
  writeDomain("<dict><key>k</key><integer>1</integer></dict>", false);
  pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    signal(SIGXFSZ, SIG_IGN);
    struct rlimit limit {
      64, 64
    };
    setrlimit(RLIMIT_FSIZE, &limit);
    os::Status written = Preferences::setValue("k", Value::string(std::string(4096, 'x')), "d");
    _exit(!written.ok() && written.error().errnum == EFBIG ? 0 : 1);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "the failed write was not reported";
  EXPECT_EQ(k(), Value::integer(1));
  EXPECT_EQ(std::distance(std::filesystem::directory_iterator(root_ / directory_),
                          std::filesystem::directory_iterator()),
            1)
      << "a temporary file was left behind";
}

TEST_F(PreferencesTest, InvalidDomainNamesAreRefused) {
  for (const std::string& domain :
       std::vector<std::string>{"", ".", "..", "a/b", "/x", std::string("a\0b", 3)}) {
    EXPECT_EQ(Preferences::synchronize(domain).error().errnum, EINVAL) << domain;
    EXPECT_EQ(Preferences::setValue("k", Value::integer(1), domain).error().errnum, EINVAL);
    EXPECT_EQ(Preferences::copyValue("k", domain), std::nullopt) << domain;
  }
  EXPECT_TRUE(Preferences::setValue("k", Value::integer(1), "..a").ok());
  EXPECT_TRUE(std::filesystem::exists(root_ / directory_ + "/..a.plist"));
}

}  // namespace
