// The in-process tests of the daemon: one server for the whole program.

#include <gtest/gtest.h>

#include "tests/axd/InProcessServer.h"

int main(int argc, char** argv) {
  ::testing::InitGoogleTest(&argc, argv);
  // gtest owns the environment; it outlives every test.
  ::testing::AddGlobalTestEnvironment(new InProcessServer());
  return RUN_ALL_TESTS();
}
