#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace value {

// Property-list files: read in either encoding (XML or binary) into a Value, write a Value as
// XML text. Files are parsed by libplist after PlistGuard has bounded their nesting and size.
// Stateless; safe to call from any thread.
//
// Integers read as Int (64 bits, two's complement, so an XML 18446744073709551615 reads as -1).
// Dates are whole seconds plus microseconds and must lie within 1933...2069 (libplist keeps 32-bit
// seconds since 2001); XML text carries whole seconds only, and within the one second before 2001
// a binary date's fraction reads as after it (libplist's accessor drops the sign). UIDs
// (keyed-archive references) are refused: no file this system reads holds one, and as a bare
// integer it would lose its meaning.
class PropertyList {
 public:
  static constexpr std::size_t kMaxDepth = 128;  // Arrays and dictionaries inside one another.
  static constexpr std::size_t kMaxValues = 1u << 18;
  static constexpr std::size_t kMaxBytes = 16u << 20;

  // The value held in |bytes|. An Error with errnum EINVAL when the bytes are not a property list
  // or hold a UID or a date out of range, or nest or expand past the limits above; EFBIG when
  // they are longer than kMaxBytes.
  static os::Result<Value> read(std::span<const std::uint8_t> bytes);

  // The value held in the file at |path|. A missing file is an Error with errnum ENOENT; other
  // file-system failures carry their errno; the contents fail as for read(), and every message
  // names the path.
  static os::Result<Value> readFile(const std::string& path);

  // |value| as XML property-list text. An Error with errnum EINVAL when the value holds what a
  // property list cannot: null, a UUID, an envelope, an unsigned integer above 2^63 - 1, a string
  // or key with a NUL byte, or a date out of range; nesting deeper than kMaxDepth is refused too.
  static os::Result<std::string> toXml(const Value& value);
};

}  // namespace value
