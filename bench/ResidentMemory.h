#pragma once

#include <sys/types.h>

#include <cstddef>

#include "platform/os/Error.h"

// What a process holds in memory at one moment, from /proc/<pid>/status. The total counts the
// pages of mapped files too (a registry the daemon maps, its libraries); the anonymous part is
// what the process allocated itself.
class ResidentMemory {
 public:
  // The figures of process |pid| now. Fails when the process is gone or the file lacks them.
  static os::Result<ResidentMemory> of(pid_t pid);

  std::size_t kibibytes() const { return kibibytes_; }
  std::size_t anonymousKibibytes() const { return anonymousKibibytes_; }

 private:
  ResidentMemory(std::size_t kibibytes, std::size_t anonymousKibibytes)
      : kibibytes_(kibibytes), anonymousKibibytes_(anonymousKibibytes) {}

  std::size_t kibibytes_;
  std::size_t anonymousKibibytes_;
};
