#pragma once

#include <sys/types.h>

#include <optional>
#include <string>

#include "platform/os/Error.h"

namespace os {

// Replaces a file whole: the bytes go to a temporary file "<dir>/.<name>.XXXXXX" beside it,
// which is then renamed over the file, so a reader (or a process that starts after a crash)
// sees the old contents or the new ones, never a mixture. Stateless; safe to call from any
// thread. Concurrent replacements of one file do not mix either: the last rename wins.
class AtomicFile {
 public:
  enum class Durability {
    // No fsync: for files that do not outlive a reboot, or that are made anew after a crash.
    Volatile,
    // The file's data and then its directory are flushed, so the rename survives a power loss.
    Durable,
  };

  // Replaces |path| with |bytes|. The new file has |mode| when given, else 0600. Fails with the
  // errno of the failed step; the temporary file is then removed and |path| left as it was
  // (except for a failure to flush the directory, which happens after the rename).
  static Status replace(const std::string& path, const std::string& bytes, Durability durability,
                        std::optional<mode_t> mode = std::nullopt);
};

}  // namespace os
