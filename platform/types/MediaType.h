#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace types {

// Media types as type identifiers ("image/png"), checked and brought to the one spelling under
// which they are compared: lower case. Stateless; safe to call from any thread.
class MediaType {
 public:
  // |text| in lower case when it is a concrete media type: a major and a sub name of 1 to 127
  // characters each, from letters, digits and "!#$&-^_.+", joined by one '/'. Nothing for
  // anything else: empty text, parameters ("; charset=..."), spaces, a second '/', a '*'.
  static std::optional<std::string> concrete(std::string_view text);

  // |text| in lower case when it is a wildcard "major/*" whose major name is as above; nothing
  // otherwise ("*/*" included: TypeRegistry gives it its own meaning).
  static std::optional<std::string> wildcard(std::string_view text);

  // The major name of a type returned by concrete() or wildcard(): "image" of "image/png".
  static std::string_view major(std::string_view type);
};

}  // namespace types
