#include "platform/value/EncodedDictionary.h"

#include <utility>

#include "platform/value/CborCodec.h"

namespace value {

EncodedDictionary::EncodedDictionary(const Dictionary& dictionary, std::string key)
    : key_(std::move(key)) {
  for (const auto& [name, element] : dictionary) {
    if (name == key_) continue;
    CborCodec::encodeText(name, entries_);
    CborCodec::encode(element, entries_);
    if (name < key_) split_ = entries_.size();
    ++count_;
  }
  entries_.shrink_to_fit();
}

void EncodedDictionary::encodeWith(const Value& value, std::vector<std::uint8_t>& out) const {
  CborCodec::encodeMapHead(count_ + 1, out);
  out.insert(out.end(), entries_.begin(), entries_.begin() + static_cast<std::ptrdiff_t>(split_));
  CborCodec::encodeText(key_, out);
  CborCodec::encode(value, out);
  out.insert(out.end(), entries_.begin() + static_cast<std::ptrdiff_t>(split_), entries_.end());
}

}  // namespace value
