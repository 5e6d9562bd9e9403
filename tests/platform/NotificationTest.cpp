#include <gtest/gtest.h>

#include <chrono>
#include <condition_variable>
#include <filesystem>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/notify/Notification.h"
#include "platform/notify/NotificationWatcher.h"
#include "tests/platform/ScopedEnvironment.h"
#include "tests/platform/TempDirectory.h"

namespace {

using notify::Notification;
using notify::NotificationWatcher;

const std::string kName = "org.annexa.test.change";

// Counts handler calls; waits for them with a generous bound so that a lost post fails the
// test instead of hanging it.
class Calls {
 public:
  std::function<void()> handler() {
    return [this] {
      std::lock_guard lock(mutex_);
      ++count_;
      changed_.notify_all();
    };
  }

  // The number of calls once it reached |count|, or the smaller number when it never does.
  std::uint64_t await(std::uint64_t count) {
    std::unique_lock lock(mutex_);
    changed_.wait_for(lock, std::chrono::seconds(60), [&] { return count_ >= count; });
    return count_;
  }

 private:
  std::mutex mutex_;
  std::condition_variable changed_;
  std::uint64_t count_ = 0;
};

class NotificationTest : public ::testing::Test {
 protected:
  void SetUp() override { environment_.set("ANNEXA_ROOT", root_.path()); }

  TempDirectory root_;
  ScopedEnvironment environment_;
};

TEST_F(NotificationTest, ConcurrentPostsAreEachReportedOnceAndEarlierOnesNever) {
  constexpr int kThreads = 4;
  constexpr int kPostsEach = 50;
  for (int i = 0; i < 5; ++i) ASSERT_TRUE(Notification::post(kName).ok());
  Calls calls;
  auto watcher = NotificationWatcher::start(kName, calls.handler());
  ASSERT_TRUE(watcher.ok()) << watcher.error().message;

  std::vector<std::thread> posters;
  for (int t = 0; t < kThreads; ++t) {
    posters.emplace_back([] {
      for (int i = 0; i < kPostsEach; ++i) EXPECT_TRUE(Notification::post(kName).ok());
    });
  }
  for (auto& poster : posters) poster.join();
  constexpr std::uint64_t kPosts = kThreads * kPostsEach;
  EXPECT_EQ(calls.await(kPosts), kPosts);
  // One more post and its call: had the watcher reported too many, the surplus shows here.
  ASSERT_TRUE(Notification::post(kName).ok());
  EXPECT_EQ(calls.await(kPosts + 1), kPosts + 1);
  EXPECT_EQ(Notification::count(kName).value(), kPosts + 6);
  // The counter is one 8-byte word in the runtime directory, shared by every process.
  EXPECT_EQ(std::filesystem::file_size(root_ / ("run/notify/" + kName)), 8u);
}

TEST_F(NotificationTest, InvalidNamesAreRefusedWithoutTouchingTheRoot) {
  const std::string invalid[] = {
      "", ".", "..", "a/b", "/", std::string("a\0b", 3), std::string(256, 'x')};
  auto errnum = [](const auto& result) { return result.ok() ? 0 : result.error().errnum; };
  for (const std::string& name : invalid) {
    SCOPED_TRACE(testing::PrintToString(name));
    EXPECT_EQ(errnum(Notification::post(name)), EINVAL);
    EXPECT_EQ(errnum(Notification::count(name)), EINVAL);
    EXPECT_EQ(errnum(NotificationWatcher::start(name, [] {})), EINVAL);
  }
  EXPECT_FALSE(std::filesystem::exists(root_ / "run"));
  for (const std::string& name : {std::string(255, 'x'), std::string("..."), std::string(".a")}) {
    EXPECT_TRUE(Notification::post(name).ok()) << name;
  }
}

// The watcher sits in poll() after its call: the destructor has to wake it, not wait out the
// safety re-read forever.
TEST_F(NotificationTest, DestroyingAnIdleWatcherReturns) {
  Calls calls;
  auto watcher = NotificationWatcher::start(kName, calls.handler());
  ASSERT_TRUE(watcher.ok()) << watcher.error().message;
  ASSERT_TRUE(Notification::post(kName).ok());
  ASSERT_EQ(calls.await(1), 1u);
  watcher.value().reset();
}

}  // namespace
