#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>

#include "platform/os/Digest.h"
#include "platform/os/Paths.h"
#include "platform/os/Process.h"

namespace {

using os::Process;

// A child that has exited, with a pidfd taken while it existed. It stays a zombie until
// reap().
struct ExitedChild {
  pid_t pid = fork();
  int pidfd = -1;

  ExitedChild() {
    if (pid == 0) _exit(0);
    auto fd = Process::openPidfd(pid);
    if (fd.ok()) pidfd = fd.value();
    siginfo_t info{};
    waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOWAIT);
  }
  ~ExitedChild() {
    reap();
    if (pidfd >= 0) close(pidfd);
  }
  void reap() { waitpid(pid, nullptr, WNOHANG); }
};

TEST(ProcessTest, OwnExecutableIsFoundAndChecked) {
  auto pidfd = Process::openPidfd(getpid());
  ASSERT_TRUE(pidfd.ok()) << pidfd.error().message;
  EXPECT_TRUE(Process::checkAlive(pidfd.value()).ok());
  auto path = Process::executablePath(getpid(), pidfd.value());
  ASSERT_TRUE(path.ok()) << path.error().message;
  EXPECT_EQ(path.value(), os::Paths::canonical("/proc/self/exe").value());

  auto image = Process::openExecutable(getpid(), pidfd.value());
  ASSERT_TRUE(image.ok()) << image.error().message;
  EXPECT_EQ(os::Digest::sha256File(image.value()).value(),
            os::Digest::sha256File(path.value()).value());
  close(image.value());
  close(pidfd.value());
}

TEST(ProcessTest, WithoutAPidfdNothingIsTrusted) {
  auto path = Process::executablePath(getpid(), -1);
  ASSERT_FALSE(path.ok());
  EXPECT_EQ(path.error().errnum, EBADF);
  EXPECT_FALSE(Process::openExecutable(getpid(), -1).ok());
}

TEST(ProcessTest, AnExitedChildHasNoExecutable) {
  ExitedChild child;
  ASSERT_GE(child.pidfd, 0);
  // A zombie still exists but has no executable any more.
  EXPECT_TRUE(Process::checkAlive(child.pidfd).ok());
  auto zombie = Process::executablePath(child.pid, child.pidfd);
  ASSERT_FALSE(zombie.ok());
  EXPECT_EQ(zombie.error().errnum, ENOENT);

  child.reap();
  auto reaped = Process::executablePath(child.pid, child.pidfd);
  ASSERT_FALSE(reaped.ok());
  EXPECT_EQ(Process::checkAlive(child.pidfd).error().errnum, ESRCH);
  auto again = Process::openPidfd(child.pid);
  ASSERT_FALSE(again.ok());
  EXPECT_EQ(again.error().errnum, ESRCH);
}

TEST(ProcessTest, AReusedPidIsNotMistakenForTheProcessThatDied) {
  // The pidfd names a child that is gone; the pid names a live process (this one), as after
  // the kernel gave the dead child's pid to someone else.
  ExitedChild child;
  ASSERT_GE(child.pidfd, 0);
  child.reap();
  auto path = Process::executablePath(getpid(), child.pidfd);
  ASSERT_FALSE(path.ok());
  EXPECT_EQ(path.error().errnum, ESRCH);
  auto image = Process::openExecutable(getpid(), child.pidfd);
  ASSERT_FALSE(image.ok());
  EXPECT_EQ(image.error().errnum, ESRCH);
}

}  // namespace
