#pragma once

#include <cstddef>
#include <set>
#include <string_view>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

namespace value {

// The entries of the maps a decoder has open, innermost last. They share one vector, so opening
// a map allocates nothing, and each closed map moves into a dictionary of exactly its size.
// Keys that arrive in ascending order (as our encoder writes them) are checked against the
// previous key alone; once a map's keys come out of order, an index of its keys finds repeats
// and the map is sorted when it closes. Not thread-safe.
class OpenMaps {
 public:
  OpenMaps() = default;
  // Its key indexes point at its own entries.
  OpenMaps(const OpenMaps&) = delete;
  OpenMaps& operator=(const OpenMaps&) = delete;

  // Opens a map; it is the innermost from now on.
  void open();
  // Adds an entry under |key| to the innermost map, awaiting its value; false, adding nothing,
  // when that map holds |key| already.
  bool addKey(std::string_view key);
  // The value of the innermost map's entry added last.
  void setValue(Value&& value);
  // Closes the innermost map; every entry has its value.
  Dictionary close();

 private:
  using Entry = Dictionary::Entry;

  // Orders positions in entries_ by their keys, and finds a key among them.
  struct KeyOrder {
    using is_transparent = void;
    const std::vector<Entry>* entries;
    std::string_view key(std::size_t at) const { return (*entries)[at].first; }
    bool operator()(std::size_t a, std::size_t b) const { return key(a) < key(b); }
    bool operator()(std::size_t a, std::string_view b) const { return key(a) < b; }
    bool operator()(std::string_view a, std::size_t b) const { return a < key(b); }
  };
  using KeyIndex = std::set<std::size_t, KeyOrder>;

  struct Map {
    std::size_t first;  // Its first entry in entries_.
    bool sorted;        // Keys so far ascending; otherwise its index is indexes_.back().
  };

  void index(Map& map);

  std::vector<Entry> entries_;
  std::vector<Map> maps_;
  std::vector<KeyIndex> indexes_;
};

}  // namespace value
