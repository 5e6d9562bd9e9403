#include "tools/axctl/ValueJson.h"

#include <cstdio>

using value::Type;
using value::Value;

nlohmann::ordered_json toJson(const Value& v) {
  switch (v.type()) {
    case Type::Null:
      return nullptr;
    case Type::Bool:
      return *v.asBool();
    case Type::Int:
      return *v.asInt();
    case Type::UInt:
      return *v.asUInt();
    case Type::Real:
      return *v.asReal();
    case Type::String:
      return *v.asString();
    case Type::Data: {
      std::string hex;
      char digits[3];
      for (std::uint8_t byte : *v.asData()) {
        std::snprintf(digits, sizeof digits, "%02x", byte);
        hex += digits;
      }
      return hex;
    }
    case Type::Date:
      return v.asDate()->seconds;
    case Type::Uuid:
      return v.asUuid()->string();
    case Type::Array: {
      auto array = nlohmann::ordered_json::array();
      for (const Value& element : *v.asArray()) array.push_back(toJson(element));
      return array;
    }
    case Type::Dictionary: {
      auto object = nlohmann::ordered_json::object();
      for (const auto& [key, element] : *v.asDictionary()) object[key] = toJson(element);
      return object;
    }
    case Type::Envelope:
      return toJson(*v.asEnvelope());
  }
  return nullptr;
}
