#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

namespace value {

// A dictionary encoded in CBOR once, with the place of one key left open, so that it can be
// written many times with a different value under that key at the cost of a copy: the discovery
// form of a plug-in, whose annotation alone changes from one request to the next. Immutable
// after construction; safe to read from several threads at once.
class EncodedDictionary {
 public:
  // Encodes the entries of |dictionary| other than |key| and remembers where |key| goes in the
  // enumeration order.
  EncodedDictionary(const Dictionary& dictionary, std::string key);

  // Appends to |out| exactly what CborCodec::encode appends for the dictionary with |key|
  // mapped to |value|.
  void encodeWith(const Value& value, std::vector<std::uint8_t>& out) const;

  // The bytes kept, for a caller that accounts for memory.
  std::size_t size() const { return entries_.size(); }

 private:
  const std::string key_;
  std::size_t count_ = 0;  // entries other than key_
  std::size_t split_ = 0;  // offset in entries_ where key_ goes
  std::vector<std::uint8_t> entries_;
};

}  // namespace value
