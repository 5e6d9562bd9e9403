#pragma once

#include <cstdint>

namespace os {

// The process's open-work count: work in progress that should keep an idle daemon from being
// stopped. On Linux nothing stops axd for idleness today; the count is exposed for a service
// manager's idle policy and for tests. Process-wide and lock-free; safe to use from any thread.
class OpenWork {
 public:
  // Adds one unit of open work.
  static void take();

  // Gives one unit back. Returns false, leaving the count at 0, when none was taken: an
  // unbalanced giveBack() never makes the count wrap.
  static bool giveBack();

  // The units taken and not yet given back.
  static std::uint64_t count();
};

}  // namespace os
