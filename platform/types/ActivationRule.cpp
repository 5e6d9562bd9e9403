#include "platform/types/ActivationRule.h"

#include <cstdint>
#include <limits>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "platform/types/TypeRegistry.h"

namespace types {

namespace {

constexpr std::uint64_t kUnlimited = std::numeric_limits<std::uint64_t>::max();

// One type of a rule and the most items that may conform to it.
struct Limit {
  std::string type;
  std::uint64_t most = kUnlimited;
};

struct Rule {
  std::vector<Limit> limits;
  std::uint64_t maxItems = kUnlimited;
};

// The host's items, counted once per distinct type so each type is tested once.
struct Items {
  std::map<std::string, std::uint64_t> countByType;
  std::uint64_t total = 0;
};

std::optional<std::uint64_t> positiveInteger(const value::Value& count) {
  if (auto i = count.asInt()) {
    return *i > 0 ? std::optional<std::uint64_t>(static_cast<std::uint64_t>(*i)) : std::nullopt;
  }
  if (auto u = count.asUInt()) return *u > 0 ? std::optional<std::uint64_t>(*u) : std::nullopt;
  return std::nullopt;
}

std::optional<std::uint64_t> limitOf(const value::Value& count) {
  if (count.asBool() == std::optional<bool>(true)) return kUnlimited;
  return positiveInteger(count);
}

std::optional<Rule> parseRule(const value::Value& rule) {
  const value::Dictionary* entries = rule.asDictionary();
  if (!entries) return std::nullopt;
  Rule parsed;
  for (const auto& [key, count] : *entries) {
    std::optional<std::uint64_t> most = key == "MaxItems" ? positiveInteger(count) : limitOf(count);
    if (!most) return std::nullopt;
    if (key == "MaxItems") {
      parsed.maxItems = *most;
    } else {
      parsed.limits.push_back(Limit{key, *most});
    }
  }
  return parsed;
}

std::optional<Items> countItems(const value::Dictionary& items) {
  const value::Value* list = items.find("items");
  const value::Array* elements = list ? list->asArray() : nullptr;
  if (!elements) return std::nullopt;
  Items counted;
  for (const value::Value& element : *elements) {
    const std::string* type = element.asString();
    if (!type) return std::nullopt;
    ++counted.countByType[*type];
    ++counted.total;
  }
  return counted;
}

// Counts |count| items of |type| against every limit of |rule| it conforms to. False when it
// conforms to none or a limit is exceeded.
bool admit(const Rule& rule, const std::string& type, std::uint64_t count,
           std::vector<std::uint64_t>& used) {
  bool conformsToSome = false;
  for (std::size_t i = 0; i < rule.limits.size(); ++i) {
    if (!TypeRegistry::conforms(type, rule.limits[i].type)) continue;
    conformsToSome = true;
    used[i] += count;
    if (used[i] > rule.limits[i].most) return false;
  }
  return conformsToSome;
}

}  // namespace

bool ActivationRule::evaluate(const value::Value& rule, const value::Dictionary& items) {
  std::optional<Rule> parsed = parseRule(rule);
  std::optional<Items> offered = countItems(items);
  if (!parsed || !offered || offered->total == 0 || offered->total > parsed->maxItems) {
    return false;
  }
  std::vector<std::uint64_t> used(parsed->limits.size(), 0);
  for (const auto& [type, count] : offered->countByType) {
    if (!admit(*parsed, type, count, used)) return false;
  }
  return true;
}

}  // namespace types
