#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace launcher {

// Turns any bundle identifier or version into one safe file name component and back. '%', '/'
// and NUL become "%25", "%2F" and "%00", and a leading '.' becomes "%2E", so a name is never
// empty, "." or "..", never names a subdirectory and never starts with the '.' that the service
// table keeps for its own files. Stateless; safe to call from any thread.
class ServiceName {
 public:
  // |text| as a file name component. |text| must not be empty (the result would be too).
  static std::string escape(std::string_view text);

  // The text that escape() turned into |component|, or nothing when escape() never yields
  // |component| (a bad or needless escape, a raw '/' or leading '.', an empty name).
  static std::optional<std::string> unescape(std::string_view component);
};

}  // namespace launcher
