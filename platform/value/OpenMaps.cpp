#include "platform/value/OpenMaps.h"

#include <algorithm>
#include <iterator>
#include <tuple>
#include <utility>

namespace value {

void OpenMaps::open() {
  maps_.push_back(Map{entries_.size(), true});
}

bool OpenMaps::addKey(std::string_view key) {
  Map& map = maps_.back();
  bool last = entries_.size() == map.first || std::string_view(entries_.back().first) < key;
  if (map.sorted && !last) {
    if (entries_.back().first == key) return false;
    index(map);
  }
  if (!map.sorted && indexes_.back().contains(key)) return false;
  entries_.emplace_back(std::piecewise_construct, std::tuple(key), std::tuple());
  if (!map.sorted) indexes_.back().insert(entries_.size() - 1);
  return true;
}

void OpenMaps::setValue(Value&& value) {
  entries_.back().second = std::move(value);
}

Dictionary OpenMaps::close() {
  Map map = maps_.back();
  maps_.pop_back();
  auto first = entries_.begin() + static_cast<std::ptrdiff_t>(map.first);
  if (!map.sorted) {
    indexes_.pop_back();
    std::sort(first, entries_.end(),
              [](const Entry& a, const Entry& b) { return a.first < b.first; });
  }
  std::vector<Entry> entries(std::make_move_iterator(first),
                             std::make_move_iterator(entries_.end()));
  entries_.erase(first, entries_.end());
  return Dictionary(std::move(entries));
}

// From now on |map|'s keys are found through an index rather than by their order.
void OpenMaps::index(Map& map) {
  map.sorted = false;
  KeyIndex& keys = indexes_.emplace_back(KeyOrder{&entries_});
  for (std::size_t at = map.first; at < entries_.size(); ++at) keys.insert(keys.end(), at);
}

}  // namespace value
