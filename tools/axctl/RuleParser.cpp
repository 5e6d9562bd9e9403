#include "tools/axctl/RuleParser.h"

#include <cerrno>

#include "tools/axctl/ValueJson.h"

using value::Value;

namespace {

Value patternOf(const std::string& text) {
  if (text == "true") return Value::boolean(true);
  if (text == "false") return Value::boolean(false);
  return Value::string(text);
}

}  // namespace

os::Status RuleParser::add(const std::string& piece) {
  if (piece.starts_with('{')) return addJson(piece);
  return addPair(piece);
}

os::Status RuleParser::addJson(const std::string& text) {
  auto entries = dictionaryFromJson(text);
  if (!entries.ok()) return entries.error();
  return merge(entries.value());
}

std::optional<value::Dictionary> RuleParser::rule() const {
  if (!added_) return std::nullopt;
  return value::Dictionary(entries_);
}

os::Status RuleParser::addPair(const std::string& pair) {
  auto equals = pair.find('=');
  if (equals == std::string::npos || equals == 0) {
    return os::Error{EINVAL, "not KEY=PATTERN: " + pair};
  }
  return merge({{pair.substr(0, equals), patternOf(pair.substr(equals + 1))}});
}

os::Status RuleParser::merge(const value::Dictionary& entries) {
  for (const auto& [key, pattern] : entries) {
    if (entries_.count(key)) return os::Error{EINVAL, "key \"" + key + "\" given twice"};
  }
  for (const auto& [key, pattern] : entries) entries_.emplace(key, pattern);
  added_ = true;
  return os::success();
}
