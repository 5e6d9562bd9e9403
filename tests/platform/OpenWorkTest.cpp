#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "platform/os/OpenWork.h"

namespace {

using os::OpenWork;

TEST(OpenWorkTest, GivingBackMoreThanWasTakenStopsAtZero) {
  ASSERT_EQ(OpenWork::count(), 0u);
  OpenWork::take();
  OpenWork::take();
  EXPECT_EQ(OpenWork::count(), 2u);
  EXPECT_TRUE(OpenWork::giveBack());
  EXPECT_TRUE(OpenWork::giveBack());
  EXPECT_FALSE(OpenWork::giveBack());
  EXPECT_EQ(OpenWork::count(), 0u);
}

TEST(OpenWorkTest, ConcurrentTakersBalance) {
  std::uint64_t before = OpenWork::count();
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
  EXPECT_EQ(OpenWork::count(), before + 4);
  for (int t = 0; t < 4; ++t) OpenWork::giveBack();
}

}  // namespace
