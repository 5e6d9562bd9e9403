#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <fstream>
#include <string>

#include "platform/sandbox/Sandbox.h"
#include "tests/plugin/ChildProcess.h"

namespace {

using sandbox::Sandbox;

bool selfUnderSeccomp() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("Seccomp:", 0) == 0) return line.find_first_not_of("\t 0", 8) != line.npos;
  }
  return false;
}

// 0, or the error number of unshare(|flags|).
int unshareOrError(int flags) {
  return unshare(flags) == 0 ? 0 : errno;
}

// Installs a filter that allows every call: enough to count as running under seccomp.
int allowAllFilter() {
  sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
  sock_fprog program{1, &allow};
  if (prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) return errno;
  return prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0 ? 0 : errno;
}

void expectSandboxed(const PausedChild& child, bool expected) {
  os::Result<bool> sandboxed = Sandbox::isSandboxed(child.pid());
  ASSERT_TRUE(sandboxed.ok()) << sandboxed.error().message;
  EXPECT_EQ(sandboxed.value(), expected);
}

TEST(SandboxedProcessTest, ThisProcessAndAPlainChildAreNot) {
  if (selfUnderSeccomp()) GTEST_SKIP() << "the test itself runs under seccomp";
  os::Result<bool> self = Sandbox::isSandboxed(getpid());
  ASSERT_TRUE(self.ok()) << self.error().message;
  EXPECT_FALSE(self.value());
  PausedChild child([] { return 0; });
  ASSERT_EQ(child.prepared(), 0);
  expectSandboxed(child, false);
}

TEST(SandboxedProcessTest, AChildUnderASeccompFilterIs) {
  PausedChild child(allowAllFilter);
  if (child.prepared() == EINVAL) GTEST_SKIP() << "no seccomp filters in this kernel";
  ASSERT_EQ(child.prepared(), 0);
  expectSandboxed(child, true);
}

TEST(SandboxedProcessTest, AChildInANewUserNamespaceIs) {
  PausedChild child([] { return unshareOrError(CLONE_NEWUSER); });
  if (child.prepared() == EPERM || child.prepared() == EINVAL || child.prepared() == ENOSPC) {
    GTEST_SKIP() << "user namespaces are not permitted here";
  }
  ASSERT_EQ(child.prepared(), 0);
  expectSandboxed(child, true);
}

TEST(SandboxedProcessTest, AChildInANewMountNamespaceIs) {
  PausedChild child([] { return unshareOrError(CLONE_NEWNS); });
  if (child.prepared() == EPERM) GTEST_SKIP() << "mount namespaces need privileges here";
  ASSERT_EQ(child.prepared(), 0);
  expectSandboxed(child, true);
}

TEST(SandboxedProcessTest, AProcessThatIsGoneIsAnError) {
  pid_t pid = fork();
  if (pid == 0) _exit(0);
  ASSERT_GT(pid, 0);
  ASSERT_EQ(waitpid(pid, nullptr, 0), pid);
  os::Result<bool> sandboxed = Sandbox::isSandboxed(pid);
  ASSERT_FALSE(sandboxed.ok());
  EXPECT_EQ(sandboxed.error().errnum, ESRCH);
}

}  // namespace
