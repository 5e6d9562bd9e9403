#pragma once

// Small operations the plug-in model and the request handlers share. All are pure.

#include <compare>
#include <optional>
#include <string_view>

#include "platform/value/Value.h"

// The results of |block| for the elements of |values| in order, leaving out the elements for
// which it returned nothing.
template <typename Collection, typename Block>
value::Array arrayWithValues(const Collection& values, Block inBlock) {
  value::Array out;
  for (const auto& element : values) {
    std::optional<value::Value> mapped = inBlock(element);
    if (mapped) out.push_back(std::move(*mapped));
  }
  return out;
}

// A copy of |dictionary| in which |key| maps to |to|; with no value the key is removed.
value::Dictionary dictionaryChanging(const value::Dictionary& dictionary, std::string key,
                                     std::optional<value::Value> to);

// Numeric-aware order of two version strings: runs of decimal digits compare by numeric value,
// everything else character by character; a string that ends first orders first.
// So "1.9" < "1.10", "2" < "2.0" and "1.0a" < "1.0b".
std::strong_ordering compareVersionString(std::string_view version, std::string_view other);
