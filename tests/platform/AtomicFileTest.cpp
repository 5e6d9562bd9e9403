// Replacing a file whole when the disk refuses part of the new contents: the old file stays, and
// no half-written file is left beside it or renamed into its place.

#include <gtest/gtest.h>
#include <signal.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "platform/os/AtomicFile.h"
#include "tests/platform/TempDirectory.h"

namespace {

std::string contents(const std::string& path) {
  std::ifstream in(path);
  std::stringstream read;
  read << in.rdbuf();
  return read.str();
}

TEST(AtomicFileTest, AWriteCutShortLeavesTheOldFileAndNoTemporary) {
  TempDirectory directory;
  std::string file = directory.write("annotations", "old contents");
  // A child process whose files may not grow past 4 KiB: its write of 64 KiB fails part way
  // (EFBIG, once SIGXFSZ no longer ends it), as on a full disk.
  pid_t child = fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    signal(SIGXFSZ, SIG_IGN);
    struct rlimit limit {
      4096, 4096
    };
    setrlimit(RLIMIT_FSIZE, &limit);
    for (auto durability :
         {os::AtomicFile::Durability::Volatile, os::AtomicFile::Durability::Durable}) {
      os::Status status = os::AtomicFile::replace(file, std::string(65536, 'x'), durability);
      if (status.ok() || status.error().errnum != EFBIG) _exit(1);
    }
    _exit(0);
  }
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0)
      << "the failed writes were not reported";
  EXPECT_EQ(contents(file), "old contents");
  std::size_t entries = 0;
  for ([[maybe_unused]] const auto& entry : std::filesystem::directory_iterator(directory.path())) {
    ++entries;
  }
  EXPECT_EQ(entries, 1u) << "a temporary file was left behind";
}

}  // namespace
