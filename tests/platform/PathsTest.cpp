#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>

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

TEST(PathsTest, RootComesFromTheEnvironmentAtEachCall) {
  ScopedEnvironment env;
  env.unset("ANNEXA_ROOT");
  EXPECT_EQ(Paths::root(), "/");
  env.set("ANNEXA_ROOT", "");
  EXPECT_EQ(Paths::root(), "/");
  env.set("ANNEXA_ROOT", "/tmp/device//");
  EXPECT_EQ(Paths::root(), "/tmp/device");
  env.set("ANNEXA_ROOT", "/");
  EXPECT_EQ(Paths::root(), "/");
  EXPECT_EQ(Paths::runtimeDir(), "/run");
  EXPECT_EQ(Paths::underRoot("var/db/registrum.sqlite"), "/var/db/registrum.sqlite");
}

TEST(PathsTest, EverythingLivesUnderASetRoot) {
  ScopedEnvironment env;
  env.set("ANNEXA_ROOT", "/tmp/device");
  env.set("XDG_RUNTIME_DIR", "/ignored");
  env.set("XDG_STATE_HOME", "/ignored");
  EXPECT_EQ(Paths::runtimeDir(), "/tmp/device/run");
  EXPECT_EQ(Paths::zynSocketDir(), "/tmp/device/run/zyn");
  EXPECT_EQ(Paths::perUserDir(geteuid()), "/tmp/device/var/users/" + euid());
  EXPECT_EQ(Paths::perUserDir(1234), "/tmp/device/var/users/1234");
  EXPECT_EQ(Paths::underRoot("etc/annexa/entitlements.d"), "/tmp/device/etc/annexa/entitlements.d");
  EXPECT_EQ(Paths::underRoot("//System"), "/tmp/device/System");
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

TEST(PathsTest, CanonicalResolvesLinksAndDots) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  std::filesystem::create_directories(dir / "a/b");
  std::filesystem::create_directory_symlink(dir / "a/b", dir / "link");
  auto real = Paths::canonical(dir.path());
  ASSERT_TRUE(real.ok());
  auto resolved = Paths::canonical(dir / "link/../b/./");
  ASSERT_TRUE(resolved.ok()) << resolved.error().message;
  EXPECT_EQ(resolved.value(), real.value() + "/a/b");
  auto missing = Paths::canonical(dir / "link/none");
  ASSERT_FALSE(missing.ok());
  EXPECT_EQ(missing.error().errnum, ENOENT);
}

TEST(PathsTest, EnsureDirectoryCreatesParentsOnce) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  std::string nested = dir / "x/y/z/";
  ASSERT_TRUE(Paths::ensureDirectory(nested, 0700).ok());
  EXPECT_EQ(modeOf(dir / "x"), 0700u);
  EXPECT_EQ(modeOf(dir / "x/y/z"), 0700u);
  ASSERT_EQ(chmod((dir / "x/y/z").c_str(), 0755), 0);
  EXPECT_TRUE(Paths::ensureDirectory(dir / "x/y/z", 0700).ok());
  EXPECT_EQ(modeOf(dir / "x/y/z"), 0755u);
}

TEST(PathsTest, EnsureDirectoryRefusesFilesInTheWay) {
  TempDirectory dir;
  ASSERT_FALSE(dir.path().empty());
  dir.write("file", "x");
  auto itself = Paths::ensureDirectory(dir / "file", 0700);
  ASSERT_FALSE(itself.ok());
  EXPECT_EQ(itself.error().errnum, ENOTDIR);
  auto below = Paths::ensureDirectory(dir / "file/sub", 0700);
  ASSERT_FALSE(below.ok());
  EXPECT_EQ(below.error().errnum, ENOTDIR);
}

}  // namespace
