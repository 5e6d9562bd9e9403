#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace sandbox {

// Lower-case hexadecimal text of byte strings, the form of paths and keys in this layer's
// files and tokens. Stateless; safe to call from any thread.
class Hex {
 public:
  // |bytes| as two lower-case hexadecimal digits per byte.
  static std::string encode(std::string_view bytes);
  // The bytes of |text|; nothing when its length is odd or it holds anything but lower-case
  // hexadecimal digits.
  static std::optional<std::string> decode(std::string_view text);
};

}  // namespace sandbox
