#pragma once

#include <optional>

#include "platform/value/Value.h"

namespace value {

// The structural conversion between property-list values and message values: a dictionary
// becomes a dictionary, an array an array, a scalar the same scalar, recursively. Stateless;
// safe to call from any thread.
class PlistBridge {
 public:
  // The message form of property-list value |plist|, which is |plist| itself: every
  // property-list value is a message value.
  static Value toMessage(const Value& plist);

  // The property-list form of |message|. An unsigned integer up to 2^63 - 1 becomes Int; a larger
  // one stays UInt, since no property-list integer holds it (PropertyList::toXml refuses it). A
  // UUID becomes its 36-character string and an envelope its carried value, converted. Null has
  // no property-list form: nothing when |message| is null, and left out of arrays and
  // dictionaries. Recursion follows the value's own nesting.
  static std::optional<Value> toPlist(const Value& message);
};

}  // namespace value
