#include "platform/os/AtomicFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>

namespace os {

namespace {

// Flushes the directory |path|, so that a rename in it survives a crash. A file system that
// cannot flush directories (EINVAL) has nothing to flush.
Status syncDirectory(const std::string& path) {
  int fd = open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
  if (fd < 0) return Error::fromErrno("open " + path);
  Status synced = success();
  if (fsync(fd) != 0 && errno != EINVAL) synced = Error::fromErrno("fsync " + path);
  close(fd);
  return synced;
}

// Writes all of |bytes| to |fd|, retrying short writes and EINTR.
Status writeAll(int fd, const std::string& bytes) {
  for (std::size_t written = 0; written < bytes.size();) {
    ssize_t n = write(fd, bytes.data() + written, bytes.size() - written);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::fromErrno("write");
    written += static_cast<std::size_t>(n);
  }
  return success();
}

Status fill(int fd, const std::string& bytes, AtomicFile::Durability durability,
            std::optional<mode_t> mode) {
  if (mode && fchmod(fd, *mode) != 0) return Error::fromErrno("fchmod");
  Status written = writeAll(fd, bytes);
  if (!written.ok()) return written;
  if (durability == AtomicFile::Durability::Durable && fsync(fd) != 0) {
    return Error::fromErrno("fsync");
  }
  return success();
}

}  // namespace

Status AtomicFile::replace(const std::string& path, const std::string& bytes, Durability durability,
                           std::optional<mode_t> mode) {
  std::size_t name = path.rfind('/') + 1;  // 0 when there is no slash (npos + 1)
  std::string directory = name == 0 ? "." : path.substr(0, name);
  std::string temporary = path.substr(0, name) + "." + path.substr(name) + ".XXXXXX";
  int fd = mkostemp(temporary.data(), O_CLOEXEC);  // mode 0600
  if (fd < 0) return Error::fromErrno("create a temporary file for " + path);
  Status written = fill(fd, bytes, durability, mode);
  if (close(fd) != 0 && written.ok()) written = Error::fromErrno("close " + temporary);
  if (written.ok() && rename(temporary.c_str(), path.c_str()) != 0) {
    written = Error::fromErrno("rename " + temporary + " to " + path);
  }
  if (!written.ok()) {
    unlink(temporary.c_str());
    return written;
  }
  return durability == Durability::Durable ? syncDirectory(directory) : success();
}

}  // namespace os
