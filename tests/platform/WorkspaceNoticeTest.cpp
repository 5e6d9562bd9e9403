#include <fcntl.h>
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <mutex>

#include "platform/registrum/Workspace.h"
#include "tests/platform/RegistryFixture.h"

extern char** environ;

namespace {

using registrum::PlugInList;
using registrum::Workspace;
using value::Value;

// Collects notices; waits for them with a generous bound so that a lost notice fails the test
// instead of hanging it.
class Collector : public registrum::Observer {
 public:
  struct Notice {
    bool install;
    PlugInList plugIns;
  };

  void pluginsDidInstall(const PlugInList& plugIns) override { add({true, plugIns}); }
  void pluginsWillUninstall(const PlugInList& plugIns) override { add({false, plugIns}); }

  // The first |count| notices, or fewer when they do not come.
  std::vector<Notice> await(std::size_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait_for(lock, std::chrono::seconds(60), [&] { return notices_.size() >= count; });
    return notices_;
  }

 private:
  void add(Notice notice) {
    std::lock_guard lock(mutex_);
    notices_.push_back(std::move(notice));
    changed_.notify_all();
  }

  std::mutex mutex_;
  std::condition_variable changed_;
  std::vector<Notice> notices_;
};

class WorkspaceNoticeTest : public ::testing::Test {
 protected:
  void SetUp() override {
    workspace_ = Workspace::open(root_.root()).value();
    other_ = Workspace::open(root_.root()).value();  // another connection, as another process
    root_.application("Notes.app", "com.example.notes");
    root_.plugIn("Notes.app/PlugIns/Share.appex", "com.example.share");
    root_.writePlist("Notes.app/PlugIns/Share.appex/Entitlements.plist",
                     Value::dictionary({{"grant", Value::boolean(true)}}));
  }

  // Starts rgctl with |arguments| against the fixture's root, its output into |out| when that is
  // a descriptor; returns its pid, or -1.
  pid_t spawnRgctl(std::vector<std::string> arguments, int out = -1) {
    std::vector<std::string> all = {RGCTL_PATH, "--root", root_.root()};
    all.insert(all.end(), arguments.begin(), arguments.end());
    std::vector<char*> argv;
    for (auto& argument : all) argv.push_back(argument.data());
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    if (out >= 0) posix_spawn_file_actions_adddup2(&actions, out, STDOUT_FILENO);
    pid_t pid = 0;
    int spawned = posix_spawn(&pid, RGCTL_PATH, &actions, nullptr, argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    return spawned == 0 ? pid : -1;
  }

  // The exit status of rgctl run to its end.
  static int exitStatus(pid_t pid) {
    int status = 0;
    if (pid < 0 || waitpid(pid, &status, 0) != pid) return -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  RegistryFixture root_;
  std::shared_ptr<Workspace> workspace_;
  std::shared_ptr<Workspace> other_;
};

TEST_F(WorkspaceNoticeTest, RemovedOrDestroyedObserversGetNothingMore) {
  auto kept = std::make_shared<Collector>();
  auto removed = std::make_shared<Collector>();
  auto destroyed = std::make_shared<Collector>();
  for (const auto& observer : {kept, removed, destroyed}) {
    ASSERT_TRUE(workspace_->addObserver(observer).ok());
  }
  workspace_->removeObserver(removed.get());
  std::weak_ptr<Collector> gone = destroyed;
  destroyed.reset();
  ASSERT_TRUE(other_->installApplication(root_ / "Notes.app").ok());
  ASSERT_EQ(kept->await(1).size(), 1u);
  EXPECT_EQ(kept->await(1)[0].plugIns.size(), 1u);
  EXPECT_TRUE(removed->await(0).empty());
  EXPECT_TRUE(gone.expired());
}

// Each observer gets every change committed after it was added, once, in commit order; an
// uninstall carries the records as they were.
TEST_F(WorkspaceNoticeTest, ChangesByRgctlReachEveryObserverOnceInOrder) {
  auto early = std::make_shared<Collector>();
  auto late = std::make_shared<Collector>();
  ASSERT_TRUE(workspace_->addObserver(early).ok());
  ASSERT_TRUE(workspace_->addObserver(early).ok());  // no second delivery
  ASSERT_EQ(exitStatus(spawnRgctl({"install", "--placeholder", root_ / "Notes.app"})), 0);
  ASSERT_TRUE(workspace_->addObserver(late).ok());
  ASSERT_EQ(exitStatus(spawnRgctl({"finish", root_ / "Notes.app"})), 0);
  ASSERT_EQ(exitStatus(spawnRgctl({"uninstall", root_ / "Notes.app"})), 0);
  auto notices = early->await(3);
  ASSERT_EQ(notices.size(), 3u);
  EXPECT_TRUE(notices[0].plugIns[0]->containingApplication()->isPlaceholder());
  EXPECT_FALSE(notices[1].plugIns[0]->containingApplication()->isPlaceholder());
  ASSERT_FALSE(notices[2].install);
  const auto& removed = *notices[2].plugIns[0];
  EXPECT_EQ(removed.uuid(), notices[0].plugIns[0]->uuid());
  EXPECT_EQ(removed.bundlePath(), root_ / "Notes.app/PlugIns/Share.appex");
  // Unsigned, so declared and not honoured.
  EXPECT_EQ(removed.declaredEntitlements().find("grant")->asBool(), true);
  EXPECT_TRUE(removed.entitlements().empty());
  EXPECT_EQ(removed.plugInDictionary(), notices[0].plugIns[0]->plugInDictionary());
  auto later = late->await(2);
  ASSERT_EQ(later.size(), 2u);
  EXPECT_FALSE(later[0].plugIns[0]->containingApplication()->isPlaceholder());
}

}  // namespace
