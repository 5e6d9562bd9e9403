#include "platform/sandbox/FileReading.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>

namespace sandbox {

os::Result<std::string> FileReading::readUpTo(int fd, std::size_t limit) {
  std::string bytes(limit, '\0');
  std::size_t filled = 0;
  while (filled < limit) {
    ssize_t n = read(fd, bytes.data() + filled, limit - filled);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("read");
    if (n == 0) break;
    filled += static_cast<std::size_t>(n);
  }
  bytes.resize(filled);
  return bytes;
}

os::Result<std::string> FileReading::readUpTo(const std::string& path, std::size_t limit) {
  int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return os::Error::fromErrno("open " + path);
  os::Result<std::string> bytes = readUpTo(fd, limit);
  close(fd);
  return bytes;
}

}  // namespace sandbox
