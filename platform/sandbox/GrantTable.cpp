#include "platform/sandbox/GrantTable.h"

namespace sandbox {

GrantTable& GrantTable::shared() {
  // Never destroyed: a released extension may be expelled while the process exits.
  static GrantTable* table = new GrantTable();
  return *table;
}

std::int64_t GrantTable::add(ExtensionToken extension) {
  std::lock_guard lock(mutex_);
  std::int64_t handle = ++lastHandle_;
  grants_.emplace(handle, std::move(extension));
  return handle;
}

bool GrantTable::remove(std::int64_t handle) {
  std::lock_guard lock(mutex_);
  return grants_.erase(handle) != 0;
}

std::optional<ExtensionToken> GrantTable::find(std::int64_t handle) const {
  std::lock_guard lock(mutex_);
  auto found = grants_.find(handle);
  if (found == grants_.end()) return std::nullopt;
  return found->second;
}

std::size_t GrantTable::size() const {
  std::lock_guard lock(mutex_);
  return grants_.size();
}

}  // namespace sandbox
