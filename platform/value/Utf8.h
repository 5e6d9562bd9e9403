#pragma once

#include <string>
#include <string_view>

namespace value {

// Checks and repairs UTF-8 text at the boundaries where text must be well-formed (the wire).
// Stateless; safe to call from any thread.
class Utf8 {
 public:
  // True when |text| is well-formed UTF-8: no overlong forms, no surrogates, nothing above
  // U+10FFFF, no truncated sequences.
  static bool valid(std::string_view text);

  // |text| with every byte that does not begin a well-formed sequence replaced by U+FFFD.
  // Well-formed text comes back unchanged.
  static std::string repaired(std::string_view text);
};

}  // namespace value
