#include "platform/value/Dictionary.h"

#include <algorithm>

#include "platform/value/Value.h"

namespace value {

namespace {

bool keyLess(const Dictionary::Entry& entry, std::string_view key) {
  return entry.first < key;
}

const std::vector<Dictionary::Entry>& emptyEntries() {
  static const std::vector<Dictionary::Entry> kEmpty;
  return kEmpty;
}

}  // namespace

Dictionary::Dictionary() = default;

Dictionary::Dictionary(std::initializer_list<Entry> entries)
    : Dictionary(std::map<std::string, Value>(entries.begin(), entries.end())) {}

Dictionary::Dictionary(std::map<std::string, Value> entries)
    : entries_(std::make_shared<const std::vector<Entry>>(
          std::make_move_iterator(entries.begin()), std::make_move_iterator(entries.end()))) {}

Dictionary::Dictionary(std::vector<Entry> sortedEntries)
    : entries_(std::make_shared<const std::vector<Entry>>(std::move(sortedEntries))) {}

Dictionary::Dictionary(std::shared_ptr<const std::vector<Entry>> entries)
    : entries_(std::move(entries)) {}

const Value* Dictionary::find(std::string_view key) const {
  auto it = std::lower_bound(begin(), end(), key, keyLess);
  if (it == end() || it->first != key) return nullptr;
  return &it->second;
}

Dictionary Dictionary::with(std::string key, Value value) const {
  // Built in order at its exact size: dictionaries live long, and a vector grown by one
  // insertion would keep twice the room it needs.
  auto entries = std::make_shared<std::vector<Entry>>();
  entries->reserve(size() + 1);
  auto at = std::lower_bound(begin(), end(), key, keyLess);
  entries->insert(entries->end(), begin(), at);
  entries->emplace_back(std::move(key), std::move(value));
  if (at != end() && at->first == entries->back().first) ++at;
  entries->insert(entries->end(), at, end());
  entries->shrink_to_fit();
  return Dictionary(std::move(entries));
}

Dictionary Dictionary::without(std::string_view key) const {
  auto at = std::lower_bound(begin(), end(), key, keyLess);
  if (at == end() || at->first != key) return *this;
  auto entries = std::make_shared<std::vector<Entry>>();
  entries->reserve(size() - 1);
  entries->insert(entries->end(), begin(), at);
  entries->insert(entries->end(), at + 1, end());
  return Dictionary(std::move(entries));
}

std::map<std::string, Value> Dictionary::toMap() const {
  return {begin(), end()};
}

std::size_t Dictionary::size() const {
  return entries_ ? entries_->size() : 0;
}

std::vector<Dictionary::Entry>::const_iterator Dictionary::begin() const {
  return entries_ ? entries_->begin() : emptyEntries().begin();
}

std::vector<Dictionary::Entry>::const_iterator Dictionary::end() const {
  return entries_ ? entries_->end() : emptyEntries().end();
}

bool Dictionary::operator==(const Dictionary& other) const {
  if (entries_ == other.entries_) return true;
  return std::equal(begin(), end(), other.begin(), other.end());
}

}  // namespace value
