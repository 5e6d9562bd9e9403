#include <gtest/gtest.h>
#include <unistd.h>

#include <cstring>
#include <memory>

#include "bench/ResidentMemory.h"

namespace {

constexpr std::size_t kMebibytes = 32;

TEST(ResidentMemory, CountsPagesThisProcessTouches) {
  auto before = ResidentMemory::of(getpid());
  ASSERT_TRUE(before.ok()) << before.error().message;
  auto block = std::make_unique<char[]>(kMebibytes << 20);
  std::memset(block.get(), 1, kMebibytes << 20);
  auto after = ResidentMemory::of(getpid());
  ASSERT_TRUE(after.ok());
  EXPECT_GE(after.value().anonymousKibibytes() - before.value().anonymousKibibytes(),
            (kMebibytes - 1) << 10);
  EXPECT_GE(after.value().kibibytes() - before.value().kibibytes(), (kMebibytes - 1) << 10);
  // Room for a sanitizer's shadow pages, not for a figure in other units.
  EXPECT_LT(after.value().kibibytes() - before.value().kibibytes(), (2 * kMebibytes) << 10);
  EXPECT_EQ(block[kMebibytes << 19], 1);
}

}  // namespace
