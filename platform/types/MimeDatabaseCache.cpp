#include "platform/types/MimeDatabaseCache.h"

namespace types {

std::shared_ptr<const MimeDatabase> MimeDatabaseCache::databaseFor(const std::string& directory) {
  auto now = std::chrono::steady_clock::now();
  std::lock_guard<std::mutex> lock(mutex_);
  Entry& entry = entries_[directory];
  if (entry.database && now - entry.checked < recheckInterval_) return entry.database;
  if (!entry.database || !entry.database->isCurrent()) {
    entry.database = MimeDatabase::read(directory);
  }
  entry.checked = now;
  return entry.database;
}

}  // namespace types
