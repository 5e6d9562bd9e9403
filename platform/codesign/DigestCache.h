#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <list>
#include <mutex>
#include <string>

#include "platform/os/Error.h"

namespace codesign {

// The SHA-256 digests of executable images, remembered by file identity (device, inode, size and
// the modification and change times of the file as opened), so that a program connecting again
// and again is read once: hashing a large program costs far more than a connect. A file that is
// rewritten changes its times, so a stale digest is never returned for it. Holds at most
// kCapacity digests, dropping the least recently used. Safe to use from several threads at once;
// images are hashed one at a time, so clients of the same program that connect together wait for
// one reading rather than each reading it.
class DigestCache {
 public:
  static constexpr std::size_t kCapacity = 64;

  // The cache shared by the process.
  static DigestCache& shared();

  DigestCache() = default;
  DigestCache(const DigestCache&) = delete;
  DigestCache& operator=(const DigestCache&) = delete;

  // The digest of the file open on |fd| (named |path| in the "hashing" log line written when it
  // is read), as 64 lower-case hexadecimal digits. Fails with the system's error number when the
  // file cannot be examined or read; a failure is not remembered.
  os::Result<std::string> sha256(int fd, const std::string& path);

 private:
  struct Key {
    dev_t device = 0;
    ino_t inode = 0;
    off_t size = 0;
    std::int64_t modified = 0;  // nanoseconds
    std::int64_t changed = 0;   // nanoseconds
    bool operator==(const Key&) const = default;
  };
  struct Entry {
    Key key;
    std::string digest;
  };

  std::mutex mutex_;          // held while an image is hashed, so it is hashed once
  std::list<Entry> entries_;  // most recently used first
};

}  // namespace codesign
