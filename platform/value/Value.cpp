#include "platform/value/Value.h"

#include <cmath>
#include <cstdio>

namespace value {

Value Value::boolean(bool b) {
  return Value(std::in_place_type<bool>, b);
}
Value Value::integer(std::int64_t i) {
  return Value(std::in_place_type<std::int64_t>, i);
}
Value Value::unsignedInteger(std::uint64_t u) {
  return Value(std::in_place_type<std::uint64_t>, u);
}
Value Value::real(double d) {
  return Value(std::in_place_type<double>, d);
}

Value Value::string(std::string s) {
  return Value(std::in_place_type<std::shared_ptr<const std::string>>,
               std::make_shared<const std::string>(std::move(s)));
}

Value Value::data(Data bytes) {
  return Value(std::in_place_type<std::shared_ptr<const Data>>,
               std::make_shared<const Data>(std::move(bytes)));
}
Value Value::date(Date d) {
  return Value(std::in_place_type<Date>, d);
}
Value Value::uuid(const Uuid& u) {
  return Value(std::in_place_type<Uuid>, u);
}

Value Value::array(Array elements) {
  return Value(std::in_place_type<std::shared_ptr<const Array>>,
               std::make_shared<const Array>(std::move(elements)));
}

Value Value::dictionary(Dictionary entries) {
  return Value(std::in_place_type<Dictionary>, std::move(entries));
}

Value Value::envelope(Value carried) {
  return Value(std::in_place_type<std::shared_ptr<const Value>>,
               std::make_shared<const Value>(std::move(carried)));
}

bool Value::isNumber() const {
  return type() == Type::Int || type() == Type::UInt || type() == Type::Real;
}

std::optional<bool> Value::asBool() const {
  if (auto* b = std::get_if<bool>(&body_)) return *b;
  return std::nullopt;
}

std::optional<std::int64_t> Value::asInt() const {
  if (auto* i = std::get_if<std::int64_t>(&body_)) return *i;
  return std::nullopt;
}

std::optional<std::uint64_t> Value::asUInt() const {
  if (auto* u = std::get_if<std::uint64_t>(&body_)) return *u;
  return std::nullopt;
}

std::optional<double> Value::asReal() const {
  if (auto* d = std::get_if<double>(&body_)) return *d;
  return std::nullopt;
}

const std::string* Value::asString() const {
  auto* s = std::get_if<std::shared_ptr<const std::string>>(&body_);
  return s ? s->get() : nullptr;
}

const Data* Value::asData() const {
  auto* d = std::get_if<std::shared_ptr<const Data>>(&body_);
  return d ? d->get() : nullptr;
}

std::optional<Date> Value::asDate() const {
  if (auto* d = std::get_if<Date>(&body_)) return *d;
  return std::nullopt;
}

const Uuid* Value::asUuid() const {
  return std::get_if<Uuid>(&body_);
}

const Array* Value::asArray() const {
  auto* a = std::get_if<std::shared_ptr<const Array>>(&body_);
  return a ? a->get() : nullptr;
}

const Dictionary* Value::asDictionary() const {
  return std::get_if<Dictionary>(&body_);
}

const Value* Value::asEnvelope() const {
  auto* e = std::get_if<std::shared_ptr<const Value>>(&body_);
  return e ? e->get() : nullptr;
}

std::optional<std::int64_t> Value::integerValue() const {
  switch (type()) {
    case Type::Bool:
      return *asBool() ? 1 : 0;
    case Type::Int:
      return *asInt();
    case Type::UInt:
      return static_cast<std::int64_t>(*asUInt());
    case Type::Real: {
      double d = *asReal();
      if (std::isnan(d)) return 0;
      if (d >= 9.2233720368547758e18) return INT64_MAX;
      if (d <= -9.2233720368547758e18) return INT64_MIN;
      return static_cast<std::int64_t>(d);
    }
    default:
      return std::nullopt;
  }
}

namespace {

void quote(const std::string& text, std::string& out) {
  out.push_back('"');
  for (char c : text) {
    if (c == '"' || c == '\\') {
      out.push_back('\\');
      out.push_back(c);
    } else if (static_cast<unsigned char>(c) < 0x20) {
      char escaped[8];
      std::snprintf(escaped, sizeof escaped, "\\u%04x", c);
      out += escaped;
    } else {
      out.push_back(c);
    }
  }
  out.push_back('"');
}

void describe(const Value& v, std::string& out);

void describeContainer(const Value& v, std::string& out) {
  if (auto* a = v.asArray()) {
    out += "[";
    for (std::size_t i = 0; i < a->size(); ++i) {
      out += i ? ", " : "";
      describe((*a)[i], out);
    }
    out += "]";
    return;
  }
  out += "{";
  bool first = true;
  for (const auto& [key, element] : *v.asDictionary()) {
    out += first ? "" : ", ";
    first = false;
    quote(key, out);
    out += ": ";
    describe(element, out);
  }
  out += "}";
}

void describe(const Value& v, std::string& out) {
  char number[64];
  switch (v.type()) {
    case Type::Null:
      out += "null";
      return;
    case Type::Bool:
      out += *v.asBool() ? "true" : "false";
      return;
    case Type::Int:
      std::snprintf(number, sizeof number, "%lld", static_cast<long long>(*v.asInt()));
      break;
    case Type::UInt:
      std::snprintf(number, sizeof number, "%llu", static_cast<unsigned long long>(*v.asUInt()));
      break;
    case Type::Real:
      std::snprintf(number, sizeof number, "%.17g", *v.asReal());
      break;
    case Type::String:
      quote(*v.asString(), out);
      return;
    case Type::Data:
      out += "<";
      for (std::uint8_t byte : *v.asData()) {
        std::snprintf(number, sizeof number, "%02x", byte);
        out += number;
      }
      out += ">";
      return;
    case Type::Date:
      std::snprintf(number, sizeof number, "date(%.3f)", v.asDate()->seconds);
      break;
    case Type::Uuid:
      out += "uuid(" + v.asUuid()->string() + ")";
      return;
    case Type::Array:
    case Type::Dictionary:
      describeContainer(v, out);
      return;
    case Type::Envelope:
      out += "plist(";
      describe(*v.asEnvelope(), out);
      out += ")";
      return;
  }
  out += number;
}

}  // namespace

std::string Value::description() const {
  std::string out;
  describe(*this, out);
  return out;
}

bool Value::operator==(const Value& other) const {
  if (type() == Type::Int && other.type() == Type::UInt)
    return *asInt() >= 0 && static_cast<std::uint64_t>(*asInt()) == *other.asUInt();
  if (type() == Type::UInt && other.type() == Type::Int) return other == *this;
  if (type() != other.type()) return false;
  switch (type()) {
    case Type::String:
      return *asString() == *other.asString();
    case Type::Data:
      return *asData() == *other.asData();
    case Type::Array:
      return *asArray() == *other.asArray();
    case Type::Envelope:
      return *asEnvelope() == *other.asEnvelope();
    default:
      return body_ == other.body_;
  }
}

}  // namespace value
