#include <gtest/gtest.h>

#include <cerrno>

#include "platform/value/CborCodec.h"

namespace {

using value::CborCodec;
using value::Value;

// Bytes from hexadecimal digits; spaces only group them for the reader.
std::vector<std::uint8_t> fromHex(std::string_view hex) {
  std::string digits;
  for (char c : hex) {
    if (c != ' ') digits += c;
  }
  std::vector<std::uint8_t> bytes;
  for (std::size_t i = 0; i + 1 < digits.size(); i += 2) {
    bytes.push_back(static_cast<std::uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
  }
  return bytes;
}

std::string toHex(const std::vector<std::uint8_t>& bytes) {
  static const char kDigits[] = "0123456789abcdef";
  std::string hex;
  for (std::uint8_t b : bytes) {
    hex += kDigits[b >> 4];
    hex += kDigits[b & 0xF];
  }
  return hex;
}

std::vector<std::uint8_t> encode(const Value& value) {
  std::vector<std::uint8_t> out;
  CborCodec::encode(value, out);
  return out;
}

value::Uuid sampleUuid() {
  return *value::Uuid::parse("00112233-4455-6677-8899-AABBCCDDEEFF");
}

TEST(CborCodecTest, EncodingsArePinned) {
  const std::pair<Value, const char*> cases[] = {
      {Value::unsignedInteger(5), "05"},
      {Value::unsignedInteger(UINT64_MAX), "1bffffffffffffffff"},
      {Value::integer(5), "da41580000 05"},
      {Value::integer(-1), "20"},
      {Value::integer(INT64_MIN), "3b7fffffffffffffff"},
      {Value::real(1.5), "fb3ff8000000000000"},
      {Value::boolean(true), "f5"},
      {Value(), "f6"},
      {Value::string("a"), "6161"},
      {Value::data({1, 2}), "420102"},
      {Value::date({0.5}), "c1 fb3fe0000000000000"},
      {Value::uuid(sampleUuid()), "d825 50 00112233445566778899aabbccddeeff"},
      {Value::envelope(Value::unsignedInteger(1)), "da41580001 01"},
      {Value::dictionary({{"b", Value::unsignedInteger(1)}, {"a", Value::array({})}}),
       "a2 6161 80 6162 01"},
      // Text that is not UTF-8 goes out repaired rather than malformed.
      {Value::string("a\xFF"), "64 61efbfbd"},
  };
  for (const auto& [v, hex] : cases) {
    EXPECT_EQ(toHex(encode(v)), toHex(fromHex(hex))) << v.description();
  }
}

TEST(CborCodecTest, OtherWellFormedEncodingsAreAccepted) {
  const std::pair<const char*, Value> cases[] = {
      {"f93e00", Value::real(1.5)},
      {"fa3fc00000", Value::real(1.5)},
      {"1805", Value::unsignedInteger(5)},
      {"c1 38ff", Value::date({-256})},
      {"9f 01 9f ff ff", Value::array({Value::unsignedInteger(1), Value::array({})})},
      {"bf 6161 01 ff", Value::dictionary({{"a", Value::unsignedInteger(1)}})},
      {"5f 420102 41 03 40 ff", Value::data({1, 2, 3})},
      {"7f 6161 62c3a9 ff", Value::string("a\xC3\xA9")},
      {"bf 7f 6162 ff 01 6161 02 ff",
       Value::dictionary({{"a", Value::unsignedInteger(2)}, {"b", Value::unsignedInteger(1)}})},
  };
  for (const auto& [hex, expected] : cases) {
    auto decoded = CborCodec::decode(fromHex(hex));
    ASSERT_TRUE(decoded.ok()) << hex << ": " << decoded.error().message;
    EXPECT_EQ(decoded.value(), expected) << hex;
  }
}

TEST(CborCodecTest, MalformedOrForeignItemsAreRefused) {
  const std::pair<const char*, const char*> cases[] = {
      {"", "ends inside"},
      {"0500", "follow"},
      {"8201", "ends inside"},
      {"5b00000000ffffffff 00", "ends inside"},
      {"9bffffffffffffffff 00", "more elements"},
      {"bbffffffffffffffff 00", "more entries"},
      {"a1 01 02", "not a text string"},
      {"a2 6161 01 6161 02", "duplicate map key \"a\""},
      {"a3 6162 01 6161 02 6162 03", "duplicate map key \"b\""},  // apart, out of order
      {"a2 6161 01 7f 6161 ff 02", "duplicate map key \"a\""},    // a chunked key
      {"a1 80 01", "not a text string"},
      {"c2 4100", "unsupported tag 2"},
      {"d825 4f 00112233445566778899aabbccddee", "16-byte"},
      {"d825 6161", "wrong type"},
      {"d825 5f ff", "wrong type"},  // a UUID is one definite byte string
      {"da41580000 20", "wrong type"},
      {"da41580000 1b8000000000000000", "out of range"},
      {"3b8000000000000000", "out of range"},
      {"c1 6161", "wrong type"},
      {"f7", "undefined"},
      {"e0", "initial byte 0xe0"},
      {"f820", "initial byte 0xf8"},
      {"1f", "initial byte 0x1f"},
      {"bf 6161 ff", "unexpected break"},
      {"5f 6161 ff", "definite chunks"},
      {"5f 5f ff ff", "definite chunks"},
      {"62 c328", "UTF-8"},
      {"62 c080", "UTF-8"},      // overlong
      {"63 eda080", "UTF-8"},    // surrogate
      {"64 f4908080", "UTF-8"},  // past U+10FFFF
      {"7f 61c3 ff", "UTF-8"},   // chunks that do not add up to UTF-8
  };
  for (const auto& [hex, message] : cases) {
    auto decoded = CborCodec::decode(fromHex(hex));
    ASSERT_FALSE(decoded.ok()) << hex;
    EXPECT_EQ(decoded.error().errnum, EBADMSG);
    EXPECT_NE(decoded.error().message.find(message), std::string::npos)
        << hex << ": " << decoded.error().message;
  }
}

// Another encoder may write keys in any order; the dictionary is the same, and encodes sorted.
// The inner maps' entries must not mix with those of the maps around them.
TEST(CborCodecTest, MapsInAnyKeyOrderDecodeToSortedDictionaries) {
  auto decoded = CborCodec::decode(
      fromHex("a3 6163 a2 6179 01 6178 02 6161 a2 6178 03 6179 04 6162 bf 6162 05 6161 06 ff"));
  ASSERT_TRUE(decoded.ok()) << decoded.error().message;
  auto pair = [](std::uint64_t x, std::uint64_t y) {
    return Value::dictionary({{"x", Value::unsignedInteger(x)}, {"y", Value::unsignedInteger(y)}});
  };
  Value expected = Value::dictionary({{"a", pair(3, 4)},
                                      {"b", Value::dictionary({{"a", Value::unsignedInteger(6)},
                                                               {"b", Value::unsignedInteger(5)}})},
                                      {"c", pair(2, 1)}});
  EXPECT_EQ(decoded.value(), expected);
  EXPECT_EQ(toHex(encode(decoded.value())), toHex(encode(expected)));
}

std::vector<std::uint8_t> nestedArrays(std::size_t depth) {
  std::vector<std::uint8_t> bytes(depth, 0x81);  // arrays of one element
  bytes.back() = 0x80;                           // the innermost is empty
  return bytes;
}

TEST(CborCodecTest, DepthIsLimitedAtExactlyTheLimit) {
  EXPECT_TRUE(CborCodec::decode(nestedArrays(128)).ok());
  EXPECT_NE(CborCodec::decode(nestedArrays(129)).error().message.find("deeper than 128"),
            std::string::npos);
  // Envelopes and maps count like arrays.
  EXPECT_TRUE(CborCodec::decode(fromHex("da41580001 a1 6161 80"), 3).ok());
  EXPECT_FALSE(CborCodec::decode(fromHex("da41580001 a1 6161 81 80"), 3).ok());
  EXPECT_FALSE(CborCodec::decode(fromHex("9f 9f 9f ff ff ff"), 2).ok());
}

// Open containers live on the builder's own stack, so even a limit far above any real use
// cannot overflow the call stack.
TEST(CborCodecTest, HugeNestingIsRefusedWithoutRecursion) {
  std::vector<std::uint8_t> bytes(100000, 0x9F);  // indefinite arrays, never closed
  EXPECT_FALSE(CborCodec::decode(bytes).ok());
  EXPECT_NE(CborCodec::decode(bytes, bytes.size() + 1).error().message.find("ends inside"),
            std::string::npos);
}

}  // namespace
