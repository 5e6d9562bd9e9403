#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

#include "platform/os/Error.h"

namespace launcher {

// Starts a program as a fresh process rather than as a copy of the caller: it gets the given
// environment and nothing else of the caller's, all signals unblocked and at their default
// actions, and no open descriptor but standard input, output and error. Stateless; safe to call
// from any thread.
class CleanSpawn {
 public:
  // Starts |program| (an absolute path) with argv[0] |program|, no further arguments and
  // exactly the "NAME=value" entries of |environment|. Returns the child's pid; the caller owns
  // the child and reaps it. Fails with the errno of posix_spawn, which includes the exec's
  // (ENOENT, EACCES, ENOEXEC...).
  static os::Result<pid_t> run(const std::string& program,
                               const std::vector<std::string>& environment);
  // The same, but the program run is the file open on |executableFd| (the caller keeps it; it
  // must lie above kExecutableDescriptor), not whatever lies at |program| by then: the child gets
  // it as descriptor kExecutableDescriptor and executes "/proc/self/fd/<that>", so a file
  // checked through |executableFd| is the file that runs, script or not. The descriptor stays
  // open in the program, read-only.
  static os::Result<pid_t> runOpened(const std::string& program, int executableFd,
                                     const std::vector<std::string>& environment);

  static constexpr int kExecutableDescriptor = 3;
};

}  // namespace launcher
