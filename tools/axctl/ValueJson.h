#pragma once

#include <nlohmann/json.hpp>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

// The JSON form of a message value for --json output: UUIDs as their text, data as lower-case
// hex, dates as seconds since 1970, an envelope as the value it carries.
nlohmann::ordered_json toJson(const value::Value& v);

// The property-list value of |json|: an integer that fits int64 is Int, a larger one UInt, a
// float Real; strings, booleans, arrays and objects map to their own kinds, binary to data.
// Returns an Error (EINVAL) naming the place, as a JSON pointer, of a null: property lists have
// none.
os::Result<value::Value> fromJson(const nlohmann::json& json);

// The dictionary written as JSON text |text|. Returns an Error (EINVAL) saying why when |text| is
// not valid JSON, not an object, repeats a key within one object, or holds a null.
os::Result<value::Dictionary> dictionaryFromJson(const std::string& text);
