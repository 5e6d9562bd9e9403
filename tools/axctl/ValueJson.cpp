#include "tools/axctl/ValueJson.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <map>
#include <set>
#include <vector>

using value::Type;
using value::Value;
using Json = nlohmann::json;

namespace {

os::Error invalid(std::string message) {
  return os::Error{EINVAL, std::move(message)};
}

os::Result<Value> convert(const Json& json, const Json::json_pointer& where);

os::Result<Value> convertArray(const Json& json, const Json::json_pointer& where) {
  value::Array elements;
  for (std::size_t i = 0; i < json.size(); ++i) {
    auto element = convert(json[i], where / i);
    if (!element.ok()) return element.error();
    elements.push_back(std::move(element).value());
  }
  return Value::array(std::move(elements));
}

os::Result<Value> convertObject(const Json& json, const Json::json_pointer& where) {
  std::map<std::string, Value> entries;
  for (const auto& [key, member] : json.items()) {
    auto element = convert(member, where / key);
    if (!element.ok()) return element.error();
    entries.emplace(key, std::move(element).value());
  }
  return Value::dictionary(value::Dictionary(std::move(entries)));
}

os::Result<Value> convertUnsigned(std::uint64_t number) {
  if (number > INT64_MAX) return Value::unsignedInteger(number);
  return Value::integer(static_cast<std::int64_t>(number));
}

os::Result<Value> convert(const Json& json, const Json::json_pointer& where) {
  switch (json.type()) {
    case Json::value_t::null:
      return invalid("null" + (where.empty() ? "" : " at " + where.to_string()) +
                     ": property lists have no null");
    case Json::value_t::boolean:
      return Value::boolean(json.get<bool>());
    case Json::value_t::number_integer:
      return Value::integer(json.get<std::int64_t>());
    case Json::value_t::number_unsigned:
      return convertUnsigned(json.get<std::uint64_t>());
    case Json::value_t::number_float:
      return Value::real(json.get<double>());
    case Json::value_t::string:
      return Value::string(json.get<std::string>());
    case Json::value_t::binary:
      return Value::data(value::Data(json.get_binary().begin(), json.get_binary().end()));
    case Json::value_t::array:
      return convertArray(json, where);
    case Json::value_t::object:
      return convertObject(json, where);
    case Json::value_t::discarded:
      break;
  }
  return invalid("not a JSON value");
}

// |text| parsed, or why it is not JSON. The parser keeps only the last of a key repeated within
// one object, so repeats are caught while it reads.
os::Result<Json> parseRefusingRepeats(const std::string& text) {
  std::vector<std::set<std::string>> open;
  std::string repeated;
  auto watch = [&](int, Json::parse_event_t event, Json& parsed) {
    if (event == Json::parse_event_t::object_start) open.emplace_back();
    if (event == Json::parse_event_t::object_end) open.pop_back();
    if (event == Json::parse_event_t::key &&
        !open.back().insert(parsed.get<std::string>()).second && repeated.empty()) {
      repeated = parsed.get<std::string>();
    }
    return true;
  };
  Json json;
  try {
    json = Json::parse(text, watch);
  } catch (const Json::parse_error& error) {
    std::string what = error.what();
    return invalid("not valid JSON (" + what.substr(what.find("] ") + 2) + "): " + text);
  }
  if (!repeated.empty()) return invalid("key \"" + repeated + "\" repeated in: " + text);
  return json;
}

}  // namespace

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

os::Result<Value> fromJson(const Json& json) {
  return convert(json, Json::json_pointer());
}

os::Result<value::Dictionary> dictionaryFromJson(const std::string& text) {
  auto json = parseRefusingRepeats(text);
  if (!json.ok()) return json.error();
  if (!json.value().is_object()) {
    return invalid(std::string("not a JSON object (") + json.value().type_name() + "): " + text);
  }
  auto converted = fromJson(json.value());
  if (!converted.ok()) return converted.error();
  return *converted.value().asDictionary();
}
