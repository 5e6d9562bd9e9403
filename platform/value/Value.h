#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <variant>
#include <vector>

#include "platform/value/Dictionary.h"
#include "platform/value/Uuid.h"

namespace value {

enum class Type {
  Null,
  Bool,
  Int,
  UInt,
  Real,
  String,
  Data,
  Date,
  Uuid,
  Array,
  Dictionary,
  // A message value that carries one whole property-list value with all its types.
  Envelope,
};

using Array = std::vector<Value>;
using Data = std::vector<std::uint8_t>;

// A moment as seconds since 1970-01-01 00:00:00 UTC.
struct Date {
  double seconds = 0;
  bool operator==(const Date&) const = default;
};

// The one value type of property lists and messages. Immutable and reference-counted: copying is
// O(1), and a value may be read from several threads at once.
//
// Property-list values are the subset without UUIDs and envelopes whose integers are Int; the
// structural conversion between the two lives in PlistBridge.
class Value {
 public:
  Value() = default;  // null

  static Value boolean(bool b);
  static Value integer(std::int64_t i);
  static Value unsignedInteger(std::uint64_t u);
  static Value real(double d);
  static Value string(std::string s);
  static Value data(Data bytes);
  static Value date(Date d);
  static Value uuid(const Uuid& u);
  static Value array(Array elements);
  static Value dictionary(Dictionary entries);
  static Value envelope(Value carried);

  Type type() const { return static_cast<Type>(body_.index()); }
  bool isNull() const { return type() == Type::Null; }
  bool isNumber() const;

  // Typed reads: the value when it is of exactly that type, otherwise nothing. Pointers live as
  // long as this value (or any copy of it).
  std::optional<bool> asBool() const;
  std::optional<std::int64_t> asInt() const;
  std::optional<std::uint64_t> asUInt() const;
  std::optional<double> asReal() const;
  const std::string* asString() const;
  const Data* asData() const;
  std::optional<Date> asDate() const;
  const Uuid* asUuid() const;
  const Array* asArray() const;
  const Dictionary* asDictionary() const;
  const Value* asEnvelope() const;

  // The integer value of any number (Real truncated toward zero) or boolean; nothing otherwise.
  std::optional<std::int64_t> integerValue() const;

  // A printable description for logs: strings quoted, containers bracketed, data as hex.
  std::string description() const;

  // Structural equality; Int and UInt holding the same integer are equal.
  bool operator==(const Value& other) const;

 private:
  using Body =
      std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double,
                   std::shared_ptr<const std::string>, std::shared_ptr<const Data>, Date, Uuid,
                   std::shared_ptr<const Array>, Dictionary, std::shared_ptr<const Value>>;

  // Builds the body in place: values are made by the hundred thousand when a reply is decoded.
  template <typename T, typename... Args>
  explicit Value(std::in_place_type_t<T> type, Args&&... args)
      : body_(type, std::forward<Args>(args)...) {}

  Body body_;
};

}  // namespace value
