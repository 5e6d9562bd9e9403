#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

#include "ScopedEnvironment.h"
#include "TempDirectory.h"
#include "platform/os/Paths.h"

namespace {

using os::Paths;

std::string euid() {
  return std::to_string(geteuid());
}

mode_t modeOf(const std::string& path) {
  struct stat st {};
  EXPECT_EQ(stat(path.c_str(), &st), 0) << path;
  return st.st_mode & 07777;
}

TEST(PathsTest, EverythingLivesUnderARootReadAtEachCall) {
  ScopedEnvironment env;
  env.unset("ANNEXA_ROOT");
  EXPECT_EQ(Paths::root(), "/");
  env.set("ANNEXA_ROOT", "");
  EXPECT_EQ(Paths::root(), "/");
  env.set("ANNEXA_ROOT", "/tmp/device//");
  env.set("XDG_RUNTIME_DIR", "/ignored");
  env.set("XDG_STATE_HOME", "/ignored");
  EXPECT_EQ(Paths::root(), "/tmp/device");
  EXPECT_EQ(Paths::zynSocketDir(), "/tmp/device/run/zyn");
  EXPECT_EQ(Paths::perUserDir(geteuid()), "/tmp/device/var/users/" + euid());
  EXPECT_EQ(Paths::underRoot("//System"), "/tmp/device/System");
  env.set("ANNEXA_ROOT", "/");
  EXPECT_EQ(Paths::runtimeDir(), "/run");
  EXPECT_EQ(Paths::underRoot("var/db/registrum.sqlite"), "/var/db/registrum.sqlite");
}

TEST(PathsTest, WithoutARootTheUsersBaseDirectoriesServe) {
  ScopedEnvironment env;
  env.unset("ANNEXA_ROOT");
  env.set("XDG_RUNTIME_DIR", "/run/user/test");
  env.set("XDG_STATE_HOME", "/home/test/state");
  EXPECT_EQ(Paths::zynSocketDir(), "/run/user/test/zyn");
  EXPECT_EQ(Paths::perUserDir(geteuid()), "/home/test/state");
  // Relative or empty settings are ignored.
  env.set("XDG_RUNTIME_DIR", "relative/run");
  env.set("XDG_STATE_HOME", "");
  env.set("HOME", "/home/test");
  EXPECT_EQ(Paths::runtimeDir(), "/run/user/" + euid());
  EXPECT_EQ(Paths::perUserDir(geteuid()), "/home/test/.local/state");
  // Another user's state is never taken from our environment; one without a home falls back
  // to the device-root layout.
  EXPECT_EQ(Paths::perUserDir(3999999), "/var/users/3999999");
}

TEST(PathsTest, EnsureDirectoryCreatesParentsOnceAndRefusesAFileInTheWay) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  std::string nested = dir / "x/y/z/";
  ASSERT_TRUE(Paths::ensureDirectory(nested, 0700).ok());
  EXPECT_EQ(modeOf(dir / "x"), 0700u);
  EXPECT_EQ(modeOf(dir / "x/y/z"), 0700u);
  ASSERT_EQ(chmod((dir / "x/y/z").c_str(), 0755), 0);
  EXPECT_TRUE(Paths::ensureDirectory(dir / "x/y/z", 0700).ok());
  EXPECT_EQ(modeOf(dir / "x/y/z"), 0755u);
  // A file below the path is WorkspaceTest's: a registry root that is a file.
  EXPECT_EQ(Paths::ensureDirectory(dir.write("file", "x"), 0700).error().errnum, ENOTDIR);
}

}  // namespace
