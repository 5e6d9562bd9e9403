#pragma once

#include <cstdint>
#include <span>

#include "platform/os/Error.h"

namespace value {

// Checks property-list bytes before libplist parses them. libplist's binary parser and its
// plist_free recurse once per nesting level, and its binary parser copies an object once for
// every reference to it, so a small hostile file could otherwise exhaust the stack (about 60,000
// levels of binary nesting, or a few hundred thousand levels of XML when the tree is freed) or
// memory (a 300-byte file of shared arrays expands to gigabytes); and libplist asserts, ending
// the process, when a dictionary key it read holds a NUL byte. Stateless; safe from any thread.
class PlistGuard {
 public:
  // Success when the property list in |bytes| nests at most |maxDepth| arrays and dictionaries
  // inside one another and expands to at most |maxNodes| values. Binary lists are measured
  // exactly; for XML the depth is an upper bound (markup inside comments and similar regions may
  // add to it, never take from it). Otherwise an Error with errnum EINVAL naming the limit, or
  // the structural fault of a binary list (a reference cycle, an offset out of range, a key that
  // is not a string or holds NUL).
  static os::Status check(std::span<const std::uint8_t> bytes, std::size_t maxDepth,
                          std::size_t maxNodes);

 private:
  static os::Status checkBinary(std::span<const std::uint8_t> bytes, std::size_t maxDepth,
                                std::size_t maxNodes);
  static os::Status checkXml(std::string_view text, std::size_t maxDepth, std::size_t maxNodes);
};

}  // namespace value
