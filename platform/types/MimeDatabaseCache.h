#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <unordered_map>

#include "platform/types/MimeDatabase.h"

namespace types {

// The MimeDatabase of each shared-mime-info directory asked for, read at the first request and
// read again when one of its files changed. Whether a file changed is checked at most once per
// |recheckInterval| per directory, so most requests are a map lookup under a mutex; a change is
// therefore seen within one interval. Entries are kept for the life of the cache (one per device
// root a process uses). Safe for concurrent access from multiple threads without any external
// synchronization.
class MimeDatabaseCache {
 public:
  explicit MimeDatabaseCache(std::chrono::steady_clock::duration recheckInterval)
      : recheckInterval_(recheckInterval) {}

  MimeDatabaseCache(const MimeDatabaseCache&) = delete;
  MimeDatabaseCache& operator=(const MimeDatabaseCache&) = delete;

  // The database of |directory| as last read; never null (missing files read as empty). The
  // caller may keep it as long as it likes: a later reading replaces it here, not in place.
  std::shared_ptr<const MimeDatabase> databaseFor(const std::string& directory);

 private:
  struct Entry {
    std::shared_ptr<const MimeDatabase> database;
    std::chrono::steady_clock::time_point checked;
  };

  const std::chrono::steady_clock::duration recheckInterval_;
  std::mutex mutex_;
  std::unordered_map<std::string, Entry> entries_;  // guarded by mutex_
};

}  // namespace types
