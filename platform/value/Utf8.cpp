#include "platform/value/Utf8.h"

#include <cstdint>
#include <cstring>

namespace value {

namespace {

// The length of the well-formed sequence at the start of |text|, or 0 when there is none.
std::size_t sequenceLength(std::string_view text) {
  auto byte = [&](std::size_t i) { return static_cast<std::uint8_t>(text[i]); };
  std::uint8_t lead = byte(0);
  if (lead < 0x80) return 1;
  std::size_t length = lead >= 0xF0 ? 4 : lead >= 0xE0 ? 3 : 2;
  // The bounds of the second byte exclude overlong forms, surrogates and values past U+10FFFF.
  std::uint8_t low = 0x80, high = 0xBF;
  if (lead < 0xC2 || lead > 0xF4) return 0;
  if (lead == 0xE0) low = 0xA0;
  if (lead == 0xED) high = 0x9F;
  if (lead == 0xF0) low = 0x90;
  if (lead == 0xF4) high = 0x8F;
  if (text.size() < length || byte(1) < low || byte(1) > high) return 0;
  for (std::size_t i = 2; i < length; ++i) {
    if ((byte(i) & 0xC0) != 0x80) return 0;
  }
  return length;
}

constexpr std::uint64_t kHighBits = 0x8080808080808080ull;

// Whether |text| is plain ASCII: the common case, and every string of a reply is checked at
// every encoding and every decoding, so it goes eight bytes at a time, the last eight
// overlapping the ones before, without stopping early.
bool ascii(std::string_view text) {
  std::uint64_t word = 0, seen = 0;
  if (text.size() < sizeof word) {
    for (char c : text) seen |= static_cast<std::uint8_t>(c);
    return seen < 0x80;
  }
  for (std::size_t i = 0; i + sizeof word <= text.size(); i += sizeof word) {
    std::memcpy(&word, text.data() + i, sizeof word);
    seen |= word;
  }
  std::memcpy(&word, text.data() + text.size() - sizeof word, sizeof word);
  return ((seen | word) & kHighBits) == 0;
}

// The length of the plain ASCII run at the start of |text|, eight bytes at a time.
std::size_t asciiPrefix(std::string_view text) {
  std::size_t i = 0;
  for (std::uint64_t word = 0; i + sizeof word <= text.size(); i += sizeof word) {
    std::memcpy(&word, text.data() + i, sizeof word);
    if (word & kHighBits) break;
  }
  while (i < text.size() && static_cast<std::uint8_t>(text[i]) < 0x80) ++i;
  return i;
}

}  // namespace

bool Utf8::valid(std::string_view text) {
  if (ascii(text)) return true;
  while (!text.empty()) {
    text.remove_prefix(asciiPrefix(text));
    if (text.empty()) return true;
    std::size_t length = sequenceLength(text);
    if (length == 0) return false;
    text.remove_prefix(length);
  }
  return true;
}

std::string Utf8::repaired(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  while (!text.empty()) {
    std::size_t length = sequenceLength(text);
    if (length == 0) {
      out += "\xEF\xBF\xBD";
      length = 1;
    } else {
      out.append(text.substr(0, length));
    }
    text.remove_prefix(length);
  }
  return out;
}

}  // namespace value
