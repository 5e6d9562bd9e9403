#include "platform/codesign/DigestCache.h"

#include <sys/stat.h>

#include "platform/os/Digest.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"

namespace codesign {

namespace {

std::int64_t nanoseconds(const timespec& time) {
  return static_cast<std::int64_t>(time.tv_sec) * 1000000000 + time.tv_nsec;
}

}  // namespace

DigestCache& DigestCache::shared() {
  static auto* cache = new DigestCache();
  return *cache;
}

os::Result<std::string> DigestCache::sha256(int fd, const std::string& path) {
  struct stat status {};
  if (fstat(fd, &status) != 0) return os::Error::fromErrno("fstat " + path);
  const Key key{status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim),
                nanoseconds(status.st_ctim)};
  std::lock_guard lock(mutex_);
  for (auto it = entries_.begin(); it != entries_.end(); ++it) {
    if (it->key != key) continue;
    entries_.splice(entries_.begin(), entries_, it);
    return it->digest;
  }
  os::Log::write(7, os::format("hashing %s", {path}));
  auto digest = os::Digest::sha256File(fd);
  if (!digest.ok()) return digest;
  entries_.push_front(Entry{key, digest.value()});
  if (entries_.size() > kCapacity) entries_.pop_back();
  return digest;
}

}  // namespace codesign
