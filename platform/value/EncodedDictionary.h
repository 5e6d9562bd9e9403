#pragma once

#include <cstdint>
#include <string_view>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

namespace value {

// A dictionary encoded in CBOR once, with the value of one key left open, so that it can be
// written many times with a different value under that key at the cost of a copy: the discovery
// form of a plug-in, whose annotation alone changes from one request to the next. Immutable
// after construction; safe to read from several threads at once.
class EncodedDictionary {
 public:
  // Encodes |dictionary| with |key| present (whatever it held is left out) and remembers where
  // the value of |key| goes.
  EncodedDictionary(const Dictionary& dictionary, std::string_view key);

  // Appends to |out| exactly what CborCodec::encode appends for the dictionary with |key|
  // mapped to |value|.
  void encodeWith(const Value& value, std::vector<std::uint8_t>& out) const;
  // The size of what encodeWith() appends for a value whose encoding takes |valueBytes|.
  std::size_t sizeWith(std::size_t valueBytes) const { return bytes_.size() + valueBytes; }

 private:
  // The encoding without the open value, which goes at valueAt_.
  std::vector<std::uint8_t> bytes_;
  std::size_t valueAt_ = 0;
};

}  // namespace value
