#pragma once

#include <string>

namespace types {

// Type conformance between type identifiers, which are media types ("image/png", "text/*").
// Safe for concurrent access from multiple threads without any external synchronization.
//
// The declared conformances come from the shared-mime-info files of the current device root
// (os::Paths::root(), read at every call): <root>/usr/share/mime/subclasses and .../aliases (see
// MimeDatabase). They are read once per root and kept in memory; a change to either file is
// seen within one second, because whether they changed is checked at most once a second.
class TypeRegistry {
 public:
  // True when |type| conforms to |to|; false otherwise, never an error. The rules:
  //  - every string conforms to itself (compared case-insensitively), well-formed or not;
  //  - apart from that, |type| must be a concrete media type (MediaType::concrete) and |to| a
  //    concrete one, a wildcard "major/*" or "*/*", or the answer is false;
  //  - aliases are resolved on both sides first;
  //  - a type conforms to its parents in the sub-class file, transitively; every "text/..." type
  //    to "text/plain"; every type to "application/octet-stream";
  //  - a type conforms to "major/*" when it, one of its aliases, or a parent in the sub-class
  //    file (transitively, aliases included) has that major name; "text/plain" and
  //    "application/octet-stream" count only as the type itself, since every type reaches them;
  //  - every concrete type conforms to "*/*".
  static bool conforms(const std::string& type, const std::string& to);
};

}  // namespace types
