#include "platform/value/EncodedDictionary.h"

#include "platform/value/CborCodec.h"

namespace value {

EncodedDictionary::EncodedDictionary(const Dictionary& dictionary, std::string_view key) {
  CborCodec::encodeMapHead(dictionary.find(key) ? dictionary.size() : dictionary.size() + 1,
                           bytes_);
  bool placed = false;
  auto placeKey = [&] {
    CborCodec::encodeText(key, bytes_);
    valueAt_ = bytes_.size();
    placed = true;
  };
  for (const auto& [name, element] : dictionary) {
    if (!placed && name >= key) placeKey();
    if (name == key) continue;
    CborCodec::encodeText(name, bytes_);
    CborCodec::encode(element, bytes_);
  }
  if (!placed) placeKey();
  bytes_.shrink_to_fit();
}

void EncodedDictionary::encodeWith(const Value& value, std::vector<std::uint8_t>& out) const {
  out.insert(out.end(), bytes_.begin(), bytes_.begin() + static_cast<std::ptrdiff_t>(valueAt_));
  CborCodec::encode(value, out);
  out.insert(out.end(), bytes_.begin() + static_cast<std::ptrdiff_t>(valueAt_), bytes_.end());
}

}  // namespace value
