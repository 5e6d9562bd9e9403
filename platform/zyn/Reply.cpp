#include "platform/zyn/Reply.h"

#include "platform/value/CborCodec.h"

namespace zyn {

const value::Value* Reply::find(const std::string& key) const {
  auto it = fields_.find(key);
  return it == fields_.end() ? nullptr : std::get_if<value::Value>(&it->second);
}

value::Value Reply::body() const {
  std::map<std::string, value::Value> entries;
  for (const auto& [key, field] : fields_) {
    if (const auto* v = std::get_if<value::Value>(&field)) {
      entries[key] = *v;
      continue;
    }
    std::vector<std::uint8_t> item;
    std::get<ItemWriter>(field)(item);
    auto decoded = value::CborCodec::decode(item);
    entries[key] = decoded.ok()
                       ? decoded.value()
                       : value::Value::string("(undecodable: " + decoded.error().message + ")");
  }
  return value::Value::dictionary(value::Dictionary(std::move(entries)));
}

void Reply::encode(std::vector<std::uint8_t>& out) const {
  value::CborCodec::encodeMapHead(fields_.size(), out);
  for (const auto& [key, field] : fields_) {
    value::CborCodec::encodeText(key, out);
    if (const auto* v = std::get_if<value::Value>(&field)) {
      value::CborCodec::encode(*v, out);
    } else {
      std::get<ItemWriter>(field)(out);
    }
  }
}

}  // namespace zyn
