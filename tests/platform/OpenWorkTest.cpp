#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "platform/os/OpenWork.h"

namespace {

using os::OpenWork;

// Giving back more than was taken stops at zero, also while other threads take and give back.
TEST(OpenWorkTest, TheCountBalancesAndNeverGoesBelowZero) {
  ASSERT_EQ(OpenWork::count(), 0u);
  std::vector<std::thread> threads;
  for (int t = 0; t < 4; ++t) {
    threads.emplace_back([] {
      for (int i = 0; i < 10000; ++i) {
        OpenWork::take();
        OpenWork::giveBack();
      }
      OpenWork::take();
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(OpenWork::count(), 4u);
  for (int t = 0; t < 4; ++t) EXPECT_TRUE(OpenWork::giveBack());
  EXPECT_FALSE(OpenWork::giveBack());
  EXPECT_EQ(OpenWork::count(), 0u);
}

}  // namespace
