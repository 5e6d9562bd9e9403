#pragma once

#include <initializer_list>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace value {

class Value;

// An immutable dictionary with string keys, enumerated in ascending byte order of the keys.
// Copying is O(1): copies share one body. Safe to read from several threads at once.
class Dictionary {
 public:
  using Entry = std::pair<std::string, Value>;

  Dictionary();
  Dictionary(std::initializer_list<Entry> entries);
  explicit Dictionary(std::map<std::string, Value> entries);
  // Adopts |sortedEntries| as they are: the caller guarantees keys in ascending byte order, none
  // twice. For a decoder that already has its entries in order, which need not go through a map.
  explicit Dictionary(std::vector<Entry> sortedEntries);

  // The value stored under |key|, or null when there is none. The pointer lives as long as this
  // dictionary (or any copy of it).
  const Value* find(std::string_view key) const;

  // A copy in which |key| maps to |value|. The receiver is unchanged.
  Dictionary with(std::string key, Value value) const;
  // A copy without |key|. The receiver is unchanged.
  Dictionary without(std::string_view key) const;

  // The entries as an editable map, for building a changed dictionary in several steps.
  std::map<std::string, Value> toMap() const;

  std::size_t size() const;
  bool empty() const { return size() == 0; }
  std::vector<Entry>::const_iterator begin() const;
  std::vector<Entry>::const_iterator end() const;

  bool operator==(const Dictionary& other) const;

 private:
  explicit Dictionary(std::shared_ptr<const std::vector<Entry>> entries);

  std::shared_ptr<const std::vector<Entry>> entries_;
};

}  // namespace value
