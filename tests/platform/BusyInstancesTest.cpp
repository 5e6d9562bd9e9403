#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>

#include <filesystem>

#include "TempDirectory.h"
#include "platform/launcher/BusyInstances.h"
#include "platform/os/Paths.h"

namespace {

using launcher::BusyInstances;
using Instances = std::vector<BusyInstances::Instance>;

TEST(BusyInstancesTest, FindsOnlyProcessesRunningFromInsideTheBundle) {
  TempDirectory dir;
  const std::string bundle = dir / "Tool.appex";
  std::filesystem::create_directories(bundle);
  std::filesystem::create_directory(dir / "Tool.app");
  std::filesystem::create_directory_symlink(bundle, dir / "link");
  std::string sleep = bundle + "/sleep", seconds = "1000";
  std::filesystem::copy_file("/bin/sleep", sleep);
  char* argv[] = {sleep.data(), seconds.data(), nullptr};
  pid_t child = 0;
  ASSERT_EQ(posix_spawn(&child, sleep.c_str(), nullptr, nullptr, argv, environ), 0);
  const std::string executable = os::Paths::canonical(sleep).value();
  const Instances running{{child, executable}};

  const std::pair<std::string, Instances> cases[] = {
      {bundle, running},      {dir / "link", running},
      {dir.path(), running},   // deeper inside counts too
      {dir / "Tool.app", {}},  // a name that merely starts the same does not
      {dir / "missing", {}},
  };
  for (const auto& [path, expected] : cases) {
    EXPECT_EQ(BusyInstances::find(path), expected) << path;
  }
  // An instance still runs after its file was replaced, e.g. by an update in place.
  std::filesystem::remove(sleep);
  EXPECT_EQ(BusyInstances::find(bundle), (Instances{{child, executable + " (deleted)"}}));
  kill(child, SIGKILL);
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
  EXPECT_TRUE(BusyInstances::find(bundle).empty());
}

}  // namespace
