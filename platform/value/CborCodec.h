#pragma once

#include <cstdint>
#include <span>
#include <string_view>
#include <vector>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

namespace value {

// Converts values to and from CBOR (RFC 8949) as the message service carries them; the mapping
// is in docs/wire-protocol.md. Stateless; safe to call from any thread.
class CborCodec {
 public:
  // Tags of the mapping: a date over seconds since 1970, a UUID over 16 bytes, a non-negative
  // signed integer over an unsigned one, and the property-list envelope over its carried item.
  static constexpr std::uint64_t kTagDate = 1;
  static constexpr std::uint64_t kTagUuid = 37;
  static constexpr std::uint64_t kTagSignedInteger = 1096286208;
  static constexpr std::uint64_t kTagEnvelope = 1096286209;

  static constexpr std::size_t kDefaultMaxDepth = 128;

  // Appends the encoding of |value| to |out|: definite lengths, the shortest integer heads,
  // every real as a 64-bit float, dictionary entries in enumeration order. A string that is not
  // valid UTF-8 goes out with each offending byte replaced by U+FFFD, so the peer always gets a
  // well-formed text string. Never fails; recursion follows the value's own nesting.
  static void encode(const Value& value, std::vector<std::uint8_t>& out);

  // The pieces of encode(), for a writer that puts an item together from parts it encoded
  // earlier: the head of an array of |count| elements, of a map of |count| entries, a tag, and
  // a text string (repaired as encode() repairs one).
  static void encodeArrayHead(std::size_t count, std::vector<std::uint8_t>& out);
  static void encodeMapHead(std::size_t count, std::vector<std::uint8_t>& out);
  static void encodeTag(std::uint64_t tag, std::vector<std::uint8_t>& out);
  static void encodeText(std::string_view text, std::vector<std::uint8_t>& out);

  // Decodes the one CBOR item that fills |bytes|, nesting at most |maxDepth| arrays, maps and
  // envelopes inside one another. Indefinite lengths are accepted. On failure returns an Error
  // with errnum EBADMSG naming the first problem and its byte offset: truncated or malformed
  // CBOR, bytes after the item, an item or tag outside the mapping (undefined, other simple
  // values, unknown tags, tag 37 over anything but 16 bytes), a map key that is not text or
  // repeats, text that is not UTF-8, deeper nesting, or more than |maxItems| items (every
  // scalar, string and container counts one), which bounds the memory a small input can make
  // the decoder take. Works without recursion on the input.
  static os::Result<Value> decode(std::span<const std::uint8_t> bytes,
                                  std::size_t maxDepth = kDefaultMaxDepth,
                                  std::size_t maxItems = SIZE_MAX);
};

}  // namespace value
