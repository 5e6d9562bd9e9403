#include "platform/value/PlistBridge.h"

namespace value {

Value PlistBridge::toMessage(const Value& plist) {
  return plist;
}

std::optional<Value> PlistBridge::toPlist(const Value& message) {
  switch (message.type()) {
    case Type::Null:
      return std::nullopt;
    case Type::UInt:
      if (*message.asUInt() > INT64_MAX) return message;
      return Value::integer(static_cast<std::int64_t>(*message.asUInt()));
    case Type::Uuid:
      return Value::string(message.asUuid()->string());
    case Type::Envelope:
      return toPlist(*message.asEnvelope());
    case Type::Array: {
      Array elements;
      for (const Value& element : *message.asArray()) {
        if (auto converted = toPlist(element)) elements.push_back(std::move(*converted));
      }
      return Value::array(std::move(elements));
    }
    case Type::Dictionary: {
      std::map<std::string, Value> entries;
      for (const auto& [key, element] : *message.asDictionary()) {
        if (auto converted = toPlist(element)) entries.emplace(key, std::move(*converted));
      }
      return Value::dictionary(Dictionary(std::move(entries)));
    }
    default:
      return message;
  }
}

}  // namespace value
