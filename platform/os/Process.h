#pragma once

#include <sys/types.h>

#include <cstdint>
#include <string>

#include "platform/os/Error.h"

namespace os {

// A file as the kernel names it, whatever path led to it.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  bool operator==(const FileIdentity&) const = default;
};

// Facts about other processes, checked against a pidfd so that a process id the kernel has
// since given to a new process is never mistaken for the one we mean. Stateless; safe to call
// from any thread.
class Process {
 public:
  // A new pidfd for process |pid|; the caller owns it and closes it. Fails with ESRCH when no
  // such process exists, or ENOSYS on a kernel without pidfd_open.
  static Result<int> openPidfd(pid_t pid);

  // Succeeds while the process that |pidfd| refers to exists (a zombie still does).
  // Fails with ESRCH when it has been reaped, EBADF when |pidfd| is not a pidfd.
  static Status checkAlive(int pidfd);

  // The path of |pid|'s executable, from /proc/<pid>/exe, checked afterwards against |pidfd|
  // (which must refer to |pid|): the answer is the path only if that process was still alive
  // after the read. Fails with ESRCH when the process is gone (or its pid was reused), EBADF
  // when |pidfd| is negative, ENOENT for a zombie or kernel thread, EACCES for a process we may
  // not inspect. A file replaced after the process started reads as "<path> (deleted)".
  static Result<std::string> executablePath(pid_t pid, int pidfd);

  // When |pid| started, in clock ticks after boot (field 22 of /proc/<pid>/stat): with the pid,
  // it names one process for as long as the machine runs, even after the pid is reused. Fails
  // with ESRCH when no such process exists, EINVAL when the stat line cannot be read.
  static Result<std::uint64_t> startTime(pid_t pid);

  // A read-only descriptor of the executable image |pid| is running (even when its file was
  // replaced or removed since), checked against |pidfd| like executablePath(). The caller owns
  // the descriptor. Fails as executablePath() does.
  static Result<int> openExecutable(pid_t pid, int pidfd);

  // The file that |pid| runs, as device and inode numbers (one stat of /proc/<pid>/exe): equal
  // answers at two times mean the process ran the same program file then, so an exec of another
  // program in between shows. Fails with ENOENT for a zombie or a process that is gone, EACCES
  // for a process we may not inspect.
  static Result<FileIdentity> executableIdentity(pid_t pid);

  // A descriptor of |pid|'s directory in /proc (O_PATH, close-on-exec), checked against |pidfd|
  // like executablePath(); the caller owns it. Lookups through it fail once that process is
  // gone, even after its pid went to another process. Fails as executablePath() does.
  static Result<int> openProcDirectory(pid_t pid, int pidfd);
  // executableIdentity() through a descriptor from openProcDirectory(): one lookup of "exe" in
  // place of a walk from the root. Fails with ENOENT for a zombie or a process that is gone.
  static Result<FileIdentity> executableIdentityAt(int procDirectory);
};

}  // namespace os
