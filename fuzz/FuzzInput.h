#pragma once

// Helpers shared by the fuzz targets that need more than one input from one byte string.

#include <algorithm>
#include <cstdint>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/value/CborCodec.h"
#include "platform/value/PropertyList.h"
#include "platform/value/Value.h"

namespace fuzz {

// The separator line between the two parts of a two-part input.
inline constexpr std::string_view kSeparator = "\n%%\n";

// |bytes| split at the first separator line into what comes before and after it; everything is
// the first part, and the second is empty, when there is no separator.
inline std::pair<std::span<const std::uint8_t>, std::span<const std::uint8_t>> splitInput(
    std::span<const std::uint8_t> bytes) {
  auto at = std::search(bytes.begin(), bytes.end(), kSeparator.begin(), kSeparator.end());
  if (at == bytes.end()) return {bytes, {}};
  auto first = static_cast<std::size_t>(at - bytes.begin());
  return {bytes.first(first), bytes.subspan(first + kSeparator.size())};
}

// The property list in |bytes| when it holds a dictionary.
inline std::optional<value::Dictionary> readDictionary(std::span<const std::uint8_t> bytes) {
  auto value = value::PropertyList::read(bytes);
  if (!value.ok() || !value.value().asDictionary()) return std::nullopt;
  return *value.value().asDictionary();
}

// True when |a| and |b| encode to the same bytes. Unlike ==, a NaN is the same as itself.
inline bool sameValue(const value::Value& a, const value::Value& b) {
  std::vector<std::uint8_t> first;
  std::vector<std::uint8_t> second;
  value::CborCodec::encode(a, first);
  value::CborCodec::encode(b, second);
  return first == second;
}

}  // namespace fuzz
