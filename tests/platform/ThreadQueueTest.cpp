// The service queue's own thread: every piece of work runs once, one at a time, in the order
// each submitter gave it, whether the thread slept, was busy or was being stopped.

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <future>
#include <thread>
#include <vector>

#include "platform/zyn/ThreadQueue.h"

namespace {

using zyn::ThreadQueue;

TEST(ThreadQueueTest, WorkOfManySubmittersRunsOnceEachInTheirOrderAndNeverOverlaps) {
  constexpr int kSubmitters = 4;
  constexpr int kEach = 20000;
  std::vector<std::vector<int>> seen(kSubmitters);
  std::atomic<int> running{0};
  std::atomic<bool> overlapped{false};
  std::atomic<bool> offQueue{false};
  {
    ThreadQueue queue("test.order");
    std::vector<std::thread> submitters;
    for (int s = 0; s < kSubmitters; ++s) {
      submitters.emplace_back([&, s] {
        for (int i = 0; i < kEach; ++i) {
          queue.async([&, s, i] {
            if (running.fetch_add(1) != 0) overlapped = true;
            if (!queue.isCurrent()) offQueue = true;
            seen[s].push_back(i);
            running.fetch_sub(1);
          });
          // Now and then the queue runs dry and sleeps, so wake-ups race with submissions; a
          // lost one would leave the rest unrun.
          if (i % 1000 == 0) std::this_thread::sleep_for(std::chrono::microseconds(200));
        }
      });
    }
    for (auto& submitter : submitters) submitter.join();
  }
  EXPECT_FALSE(overlapped);
  EXPECT_FALSE(offQueue);
  for (int s = 0; s < kSubmitters; ++s) {
    ASSERT_EQ(seen[s].size(), static_cast<std::size_t>(kEach)) << "submitter " << s;
    for (int i = 0; i < kEach; ++i) ASSERT_EQ(seen[s][i], i) << "submitter " << s;
  }
}

TEST(ThreadQueueTest, DestructionRunsTheQueuedWorkAndWhatItQueues) {
  std::vector<int> ran;
  std::promise<void> go;
  std::shared_future<void> released = go.get_future().share();
  std::thread releaser;
  {
    ThreadQueue queue("test.drain");
    queue.async([released] { released.wait(); });
    for (int i = 0; i < 3; ++i) queue.async([&ran, i] { ran.push_back(i); });
    queue.async([&] { queue.async([&ran] { ran.push_back(3); }); });
    // Released only once destruction has begun, with everything above still queued.
    releaser = std::thread([&go] {
      std::this_thread::sleep_for(std::chrono::milliseconds(20));
      go.set_value();
    });
  }
  releaser.join();
  EXPECT_EQ(ran, (std::vector<int>{0, 1, 2, 3}));
}

}  // namespace
