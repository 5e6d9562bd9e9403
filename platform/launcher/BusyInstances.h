#pragma once

#include <sys/types.h>

#include <string>
#include <vector>

namespace launcher {

// Finds the running instances of a plug-in: the processes whose executable lies inside its
// bundle directory, read from /proc. Stateless; safe to call from any thread.
class BusyInstances {
 public:
  struct Instance {
    pid_t pid;
    // As the kernel reports it: canonical, and ending in " (deleted)" when the file was removed
    // or replaced after the process started (such a process still counts).
    std::string executablePath;

    bool operator==(const Instance&) const = default;
  };

  // The processes whose executable lies below |bundlePath| (compared after resolving its
  // symbolic links, "." and ".."), sorted by pid. Empty when |bundlePath| cannot be resolved;
  // processes that end during the scan or whose executable cannot be read (another user's,
  // kernel threads) are left out.
  static std::vector<Instance> find(const std::string& bundlePath);
};

}  // namespace launcher
