#pragma once

#include <nlohmann/json.hpp>

#include "platform/value/Value.h"

// The JSON form of a message value for --json output: UUIDs as their text, data as lower-case
// hex, dates as seconds since 1970, an envelope as the value it carries.
nlohmann::ordered_json toJson(const value::Value& v);
