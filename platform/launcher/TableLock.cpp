#include "platform/launcher/TableLock.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <utility>

namespace launcher {

os::Result<TableLock> TableLock::acquire(const std::string& directory, Mode mode) {
  const std::string path = directory + "/.lock";
  TableLock lock(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (lock.fd_ < 0) return os::Error::fromErrno("open " + path);
  const int operation = mode == Mode::Shared ? LOCK_SH : LOCK_EX;
  while (flock(lock.fd_, operation) != 0) {
    if (errno != EINTR) return os::Error::fromErrno("flock " + path);
  }
  return lock;
}

TableLock::TableLock(TableLock&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}

TableLock& TableLock::operator=(TableLock&& other) noexcept {
  std::swap(fd_, other.fd_);
  return *this;
}

TableLock::~TableLock() {
  if (fd_ >= 0) close(fd_);
}

}  // namespace launcher
