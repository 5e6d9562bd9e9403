// The daemon's classes in this process, with one server for the whole program (a process has
// exactly one). Its log goes to a file that the tests read back.

#include <fcntl.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>

#include "tests/axd/InProcessServer.h"

int main(int argc, char** argv) {
  ::testing::InitGoogleTest(&argc, argv);
  InProcessServer::setUp();
  return RUN_ALL_TESTS();
}
