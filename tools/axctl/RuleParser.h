#pragma once

#include <map>
#include <optional>
#include <string>

#include "platform/os/Error.h"
#include "platform/value/Value.h"

// Builds the match rule of `axctl match` from the pieces of its command line: KEY=PATTERN pairs
// and JSON objects, merged into one dictionary in which every key comes from one piece only.
// Not thread-safe; one parser per command line.
class RuleParser {
 public:
  // Adds |piece|: the entries of a JSON object when it starts with '{', else the pair KEY=PATTERN
  // (split at the first '='), whose PATTERN is a string, except "true" and "false", which are the
  // booleans. Returns an Error (EINVAL), and adds nothing, when the piece is malformed or names a
  // key that an earlier piece named.
  os::Status add(const std::string& piece);

  // Adds the entries of JSON object |text|; errors as add().
  os::Status addJson(const std::string& text);

  // The rule built so far; nothing when no piece was added (an empty JSON object is a piece).
  std::optional<value::Dictionary> rule() const;

 private:
  os::Status addPair(const std::string& pair);
  // Adds all of |entries|, or none when one of their keys is already in the rule.
  os::Status merge(const value::Dictionary& entries);

  bool added_ = false;
  std::map<std::string, value::Value> entries_;
};
