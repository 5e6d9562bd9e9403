#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>

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

TEST(ProcessTest, WithoutAPidfdNothingIsTrusted) {
  EXPECT_EQ(Process::executablePath(getpid(), -1).error().errnum, EBADF);
  EXPECT_FALSE(Process::openExecutable(getpid(), -1).ok());
}

TEST(ProcessTest, AnExitedChildHasNoExecutable) {
  ExitedChild child;
  ASSERT_GE(child.pidfd, 0);
  // A zombie still exists but has no executable any more.
  EXPECT_TRUE(Process::checkAlive(child.pidfd).ok());
  EXPECT_EQ(Process::executablePath(child.pid, child.pidfd).error().errnum, ENOENT);

  child.reap();
  EXPECT_FALSE(Process::executablePath(child.pid, child.pidfd).ok());
  EXPECT_EQ(Process::checkAlive(child.pidfd).error().errnum, ESRCH);
  EXPECT_EQ(Process::openPidfd(child.pid).error().errnum, ESRCH);
}

TEST(ProcessTest, AReusedPidIsNotMistakenForTheProcessThatDied) {
  // The pidfd names a child that is gone; the pid names a live process (this one), as after
  // the kernel gave the dead child's pid to someone else.
  ExitedChild child;
  ASSERT_GE(child.pidfd, 0);
  child.reap();
  EXPECT_EQ(Process::executablePath(getpid(), child.pidfd).error().errnum, ESRCH);
  EXPECT_EQ(Process::openExecutable(getpid(), child.pidfd).error().errnum, ESRCH);
}

// A child named |name| (its command name, which /proc puts in parentheses) that waits until it is
// killed.
pid_t sleeperNamed(const char* name) {
  int ready[2];
  if (pipe(ready) != 0) return -1;
  pid_t pid = fork();
  if (pid == 0) {
    prctl(PR_SET_NAME, name);
    (void)!write(ready[1], "x", 1);
    pause();
    _exit(0);
  }
  char byte;
  (void)!read(ready[0], &byte, 1);
  close(ready[0]);
  close(ready[1]);
  return pid;
}

TEST(ProcessTest, StartTimesAreReadPastAnyCommandName) {
  pid_t plain = sleeperNamed("plain");
  pid_t odd = sleeperNamed("a) 1 2) (3");
  auto plainStart = Process::startTime(plain);
  auto oddStart = Process::startTime(odd);
  for (pid_t child : {plain, odd}) kill(child, SIGKILL);
  ASSERT_TRUE(plainStart.ok() && oddStart.ok());
  // Started one after the other, so within a second (100 ticks) of each other; a field counted
  // from the wrong parenthesis would be another number altogether.
  EXPECT_GE(oddStart.value(), plainStart.value());
  EXPECT_LE(oddStart.value() - plainStart.value(), 100u);
  EXPECT_LE(Process::startTime(getpid()).value(), plainStart.value());

  for (pid_t child : {plain, odd}) waitpid(child, nullptr, 0);
  EXPECT_EQ(Process::startTime(plain).error().errnum, ESRCH);
  EXPECT_EQ(Process::startTime(0).error().errnum, ESRCH);
}

TEST(ProcessTest, AProcDirectoryNamesItsProcessOnlyWhileThatProcessLives) {
  pid_t child = sleeperNamed("procdir");
  auto pidfd = Process::openPidfd(child);
  ASSERT_TRUE(pidfd.ok());
  auto directory = Process::openProcDirectory(child, pidfd.value());
  ASSERT_TRUE(directory.ok());
  auto through = Process::executableIdentityAt(directory.value());
  auto byPid = Process::executableIdentity(child);
  ASSERT_TRUE(through.ok() && byPid.ok());
  EXPECT_EQ(through.value(), byPid.value());

  kill(child, SIGKILL);
  waitpid(child, nullptr, 0);
  // Whoever gets the pid next, the directory still names the process that is gone.
  EXPECT_FALSE(Process::executableIdentityAt(directory.value()).ok());
  EXPECT_FALSE(Process::openProcDirectory(child, pidfd.value()).ok());
  close(directory.value());
  close(pidfd.value());
}

}  // namespace
