#pragma once

#include <cstddef>
#include <string>

#include "platform/os/Error.h"

namespace sandbox {

// Reading the small files of this layer (/proc entries, the key file). Stateless; safe to call
// from any thread.
class FileReading {
 public:
  // Up to |limit| bytes of |fd| from its current offset; fewer at the end of the file. Fails
  // with the error number of the read that failed. The caller keeps ownership of |fd|.
  static os::Result<std::string> readUpTo(int fd, std::size_t limit);

  // Up to |limit| bytes of the file at |path|. Fails with the error number of the open or read
  // that failed (ENOENT for a missing file).
  static os::Result<std::string> readUpTo(const std::string& path, std::size_t limit);
};

}  // namespace sandbox
