#include "platform/sandbox/BootKey.h"

#include <fcntl.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <optional>

#include "platform/os/AtomicFile.h"
#include "platform/os/Paths.h"
#include "platform/sandbox/FileReading.h"
#include "platform/sandbox/Hex.h"

namespace sandbox {

namespace {

constexpr std::size_t kKeySize = 32;
constexpr std::size_t kBootIdSize = 36;
constexpr const char* kBootIdPath = "/proc/sys/kernel/random/boot_id";

std::string directory() {
  return os::Paths::runtimeDir() + "/sandbox";
}

// Closes a descriptor when it goes out of scope.
class FileDescriptor {
 public:
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  ~FileDescriptor() {
    if (fd_ >= 0) close(fd_);
  }
  int get() const { return fd_; }

 private:
  int fd_;
};

os::Result<std::string> currentBootId() {
  os::Result<std::string> text = FileReading::readUpTo(kBootIdPath, kBootIdSize);
  if (text.ok() && text.value().size() != kBootIdSize) {
    return os::Error{EIO, std::string(kBootIdPath) + ": unexpected contents"};
  }
  return text;
}

// The key in the file's text when it is "<bootId>\n<64 hex digits>\n"; nothing otherwise.
std::optional<std::string> parse(const std::string& text, const std::string& bootId) {
  if (text.size() != kBootIdSize + 2 * kKeySize + 2) return std::nullopt;
  if (text.compare(0, kBootIdSize, bootId) != 0 || text[kBootIdSize] != '\n') return std::nullopt;
  if (text.back() != '\n') return std::nullopt;
  return Hex::decode(std::string_view(text).substr(kBootIdSize + 1, 2 * kKeySize));
}

// The usable key of this boot in the file, or nothing when there is none to use.
os::Result<std::optional<std::string>> readKey(const std::string& bootId) {
  const std::string file = BootKey::path();
  FileDescriptor fd(open(file.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  if (fd.get() < 0 && (errno == ENOENT || errno == ELOOP)) return std::optional<std::string>();
  if (fd.get() < 0) return os::Error::fromErrno("open " + file);
  struct stat st {};
  if (fstat(fd.get(), &st) != 0) return os::Error::fromErrno("fstat " + file);
  // A key that others could read or change would let them forge tokens: never use one.
  if (!S_ISREG(st.st_mode) || st.st_uid != geteuid() || (st.st_mode & 077) != 0) {
    return std::optional<std::string>();
  }
  os::Result<std::string> text = FileReading::readUpTo(fd.get(), kBootIdSize + 2 * kKeySize + 3);
  if (!text.ok()) return text.error();
  return parse(text.value(), bootId);
}

os::Result<std::string> randomKey() {
  std::string key(kKeySize, '\0');
  for (std::size_t filled = 0; filled < kKeySize;) {
    ssize_t n = getrandom(key.data() + filled, kKeySize - filled, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return os::Error::fromErrno("getrandom");
    filled += static_cast<std::size_t>(n);
  }
  return key;
}

// Writes a fresh key to a temporary file and renames it over the key file, so that readers see
// either the old file or the whole new one. No fsync: after a crash the boot id changes and the
// key is made anew anyway.
os::Result<std::string> replaceKey(const std::string& bootId) {
  os::Result<std::string> key = randomKey();
  if (!key.ok()) return key;
  std::string text = bootId + "\n" + Hex::encode(key.value()) + "\n";
  os::Status written =
      os::AtomicFile::replace(BootKey::path(), text, os::AtomicFile::Durability::Volatile);
  if (!written.ok()) return written.error();
  return key;
}

// The slow path: under the creation lock, read again (another process may have just made the
// key) and make a new key only when there is still none to use.
os::Result<std::string> loadLocked(const std::string& bootId) {
  os::Status made = os::Paths::ensureRuntimeDirectory(directory(), 0700);
  if (!made.ok()) return made.error();
  std::string lockPath = directory() + "/key.lock";
  FileDescriptor lock(open(lockPath.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
  if (lock.get() < 0) return os::Error::fromErrno("open " + lockPath);
  while (flock(lock.get(), LOCK_EX) != 0) {
    if (errno != EINTR) return os::Error::fromErrno("flock " + lockPath);
  }
  os::Result<std::optional<std::string>> existing = readKey(bootId);
  if (!existing.ok()) return existing.error();
  if (existing.value()) return *existing.value();
  return replaceKey(bootId);
}

}  // namespace

std::string BootKey::path() {
  return directory() + "/key";
}

os::Result<std::string> BootKey::load() {
  os::Result<std::string> bootId = currentBootId();
  if (!bootId.ok()) return bootId;
  os::Result<std::optional<std::string>> existing = readKey(bootId.value());
  if (!existing.ok()) return existing.error();
  if (existing.value()) return *existing.value();
  return loadLocked(bootId.value());
}

}  // namespace sandbox
