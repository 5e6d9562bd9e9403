#include "platform/notify/Notification.h"

#include <fcntl.h>
#include <sys/file.h>
#include <unistd.h>

#include <cerrno>
#include <string_view>

#include "platform/os/Paths.h"

namespace notify {

namespace {

constexpr std::size_t kNameMax = 255;
constexpr std::size_t kShownNameMax = 40;
constexpr mode_t kDirectoryMode = 0755;
constexpr mode_t kFileMode = 0644;

// What is wrong with |name|, or nothing when it is valid.
const char* fault(const std::string& name) {
  if (name.empty()) return "empty";
  if (name == "." || name == "..") return "reserved";
  if (name.size() > kNameMax) return "longer than 255 bytes";
  if (name.find('/') != std::string::npos) return "contains '/'";
  if (name.find('\0') != std::string::npos) return "contains NUL";
  return nullptr;
}

// |name| for a message: NUL shown as "\0", long names cut short.
std::string shown(const std::string& name) {
  std::string text;
  for (char c : name.substr(0, kShownNameMax))
    text += c == '\0' ? std::string("\\0") : std::string(1, c);
  return "\"" + text + (name.size() > kShownNameMax ? "...\"" : "\"");
}

int lock(int fd, int operation) {
  int result;
  do {
    result = flock(fd, operation);
  } while (result < 0 && errno == EINTR);
  return result;
}

// The counter at the start of |fd| (little-endian); 0 while the file holds fewer bytes.
os::Result<std::uint64_t> readCounter(int fd, const std::string& file) {
  unsigned char bytes[sizeof(std::uint64_t)];
  ssize_t got = pread(fd, bytes, sizeof bytes, 0);
  if (got < 0) return os::Error::fromErrno("read " + file);
  std::uint64_t counter = 0;
  if (got < static_cast<ssize_t>(sizeof bytes)) return counter;
  for (std::size_t i = sizeof bytes; i-- > 0;) counter = (counter << 8) | bytes[i];
  return counter;
}

os::Status writeCounter(int fd, std::uint64_t counter, const std::string& file) {
  unsigned char bytes[sizeof(std::uint64_t)];
  for (unsigned char& byte : bytes) {
    byte = static_cast<unsigned char>(counter & 0xff);
    counter >>= 8;
  }
  ssize_t put = pwrite(fd, bytes, sizeof bytes, 0);
  if (put < 0) return os::Error::fromErrno("write " + file);
  if (put != static_cast<ssize_t>(sizeof bytes)) return os::Error{EIO, "write " + file + ": short"};
  return os::success();
}

// Increments the counter of |fd| under an exclusive lock, which close() releases.
os::Status increment(int fd, const std::string& file) {
  if (lock(fd, LOCK_EX) < 0) return os::Error::fromErrno("flock " + file);
  os::Result<std::uint64_t> counter = readCounter(fd, file);
  if (!counter.ok()) return counter.error();
  return writeCounter(fd, counter.value() + 1, file);
}

}  // namespace

os::Status Notification::post(const std::string& name) {
  os::Status valid = validate(name);
  if (!valid.ok()) return valid;
  os::Result<std::string> made = makeDirectory();
  if (!made.ok()) return made.error();
  std::string file = made.value() + "/" + name;
  // Never through a link: another process could point one at a file of this user's.
  int fd = open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, kFileMode);
  if (fd < 0) return os::Error::fromErrno("open " + file);
  os::Status incremented = increment(fd, file);
  // The close is what wakes the watchers (IN_CLOSE_WRITE), after the lock is gone.
  if (close(fd) < 0 && incremented.ok()) return os::Error::fromErrno("close " + file);
  return incremented;
}

os::Result<std::uint64_t> Notification::count(const std::string& name) {
  os::Status valid = validate(name);
  if (!valid.ok()) return valid.error();
  return countAt(path(name));
}

std::string Notification::path(const std::string& name) {
  return directory() + "/" + name;
}

std::string Notification::directory() {
  return os::Paths::runtimeDir() + "/notify";
}

os::Result<std::string> Notification::makeDirectory() {
  std::string made = directory();
  os::Status status = os::Paths::ensureRuntimeDirectory(made, kDirectoryMode);
  if (!status.ok()) return status.error();
  return made;
}

os::Status Notification::validate(const std::string& name) {
  const char* wrong = fault(name);
  if (!wrong) return os::success();
  return os::Error{EINVAL, "invalid notification name " + shown(name) + ": " + wrong};
}

os::Result<std::uint64_t> Notification::countAt(const std::string& file) {
  int fd = open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
  if (fd < 0 && errno == ENOENT) return std::uint64_t{0};
  if (fd < 0) return os::Error::fromErrno("open " + file);
  os::Result<std::uint64_t> counter =
      lock(fd, LOCK_SH) < 0 ? os::Error::fromErrno("flock " + file) : readCounter(fd, file);
  close(fd);
  return counter;
}

}  // namespace notify
