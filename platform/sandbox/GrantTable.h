#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>

#include "platform/sandbox/ExtensionToken.h"

namespace sandbox {

// The extensions this process has consumed and not yet released, by handle. Handles start at 1
// and are never reused within the process, so 0 always means "nothing consumed". Safe for
// concurrent access from multiple threads without external synchronisation.
class GrantTable {
 public:
  // The process's one table.
  static GrantTable& shared();

  // Records |extension| and returns its new handle (always greater than 0).
  std::int64_t add(ExtensionToken extension);
  // Forgets the grant of |handle|. Returns false when there is none (never issued, or already
  // removed).
  bool remove(std::int64_t handle);
  // The grant of |handle|, or nothing when there is none.
  std::optional<ExtensionToken> find(std::int64_t handle) const;
  // The number of grants held.
  std::size_t size() const;

 private:
  mutable std::mutex mutex_;
  std::int64_t lastHandle_ = 0;
  std::map<std::int64_t, ExtensionToken> grants_;
};

}  // namespace sandbox
