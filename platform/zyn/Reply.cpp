#include "platform/zyn/Reply.h"

#include "platform/value/CborCodec.h"

namespace zyn {

namespace {

void writeWhole(const ItemStream& stream, std::vector<std::uint8_t>& out) {
  for (std::size_t part = 0; part < stream.parts(); ++part) stream.writePart(part, out);
}

}  // namespace

const value::Value* Reply::find(const std::string& key) const {
  auto it = fields_.find(key);
  return it == fields_.end() ? nullptr : std::get_if<value::Value>(&it->second);
}

bool Reply::streamed() const {
  for (const auto& entry : fields_) {
    if (std::holds_alternative<std::shared_ptr<const ItemStream>>(entry.second)) return true;
  }
  return false;
}

value::Value Reply::body() const {
  std::map<std::string, value::Value> entries;
  for (const auto& [key, field] : fields_) {
    if (const auto* v = std::get_if<value::Value>(&field)) {
      entries[key] = *v;
      continue;
    }
    std::vector<std::uint8_t> item;
    writeWhole(*std::get<std::shared_ptr<const ItemStream>>(field), item);
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
      writeWhole(*std::get<std::shared_ptr<const ItemStream>>(field), out);
    }
  }
}

std::vector<FrameSource::Segment> Reply::segments() const {
  std::vector<FrameSource::Segment> segments(1);
  auto bytes = [&]() -> std::vector<std::uint8_t>& {
    if (!std::holds_alternative<std::vector<std::uint8_t>>(segments.back())) {
      segments.emplace_back(std::vector<std::uint8_t>());
    }
    return std::get<std::vector<std::uint8_t>>(segments.back());
  };
  value::CborCodec::encodeMapHead(fields_.size(), bytes());
  for (const auto& [key, field] : fields_) {
    value::CborCodec::encodeText(key, bytes());
    if (const auto* v = std::get_if<value::Value>(&field)) {
      value::CborCodec::encode(*v, bytes());
    } else {
      segments.emplace_back(std::get<std::shared_ptr<const ItemStream>>(field));
    }
  }
  return segments;
}

}  // namespace zyn
