// The matching rules of a plug-in record: the rule language that discovery and the hosts'
// restriction entitlements use.

#include <compare>
#include <cstdint>
#include <string_view>

#include "Annexa/AXUtilities.h"
#include "axd/AXDElectionFilter.h"
#include "axd/AXDPlugIn.h"
#include "axd/AXDServer.h"
#include "platform/os/Format.h"
#include "platform/os/Log.h"
#include "platform/types/ActivationRule.h"
#include "platform/types/TypeRegistry.h"

namespace {

constexpr std::string_view kEntitlementPrefix = "ENTITLEMENT:";
constexpr std::string_view kConforms = "?UT-CONFORMS:";
constexpr std::string_view kIs = "?UT-IS:";
const std::string kUuidKey = AXD_VENDOR_PREFIX ".uuid";

// The comparison operators in the order their prefixes are tried: "<>" before "<", and so on.
struct Operator {
  std::string_view prefix;
  bool (*holds)(std::strong_ordering);
};
constexpr Operator kOperators[] = {
    {"<>", [](std::strong_ordering o) { return o != 0; }},
    {"<=", [](std::strong_ordering o) { return o <= 0; }},
    {">=", [](std::strong_ordering o) { return o >= 0; }},
    {"=", [](std::strong_ordering o) { return o == 0; }},
    {"<", [](std::strong_ordering o) { return o < 0; }},
    {">", [](std::strong_ordering o) { return o > 0; }},
};

bool isFalse(const value::Value& v) {
  return v.asBool() == std::optional<bool>(false);
}

// The election as the rule language reads it. Building the record stored any auto-election
// already, so no entitlement is consulted here.
std::string electionText(const AXDPlugIn& plugIn) {
  auto server = AXDServer::server();
  return AXDElectionFilter::electionText(
      server ? server->annotationForPlugIn(plugIn) : std::nullopt, value::Dictionary());
}

}  // namespace

bool AXDPlugIn::match(const std::optional<value::Dictionary>& rule) const {
  if (!rule) return true;
  for (const auto& [key, pattern] : *rule) {
    if (!matchKey(key, pattern)) return false;
  }
  return true;
}

bool AXDPlugIn::matchKey(const std::string& key, const value::Value& pattern) const {
  std::optional<value::Value> found;
  if (key.starts_with(kEntitlementPrefix)) {
    found = valueForEntitlement(std::string_view(key).substr(kEntitlementPrefix.size()));
  } else if (key == "QSExtensionIdentifier") {
    found = facts_.identifier;
  } else if (key == "QSExtensionPointIdentifier") {
    found = facts_.extensionPoint;
  } else if (key == kUuidKey) {
    if (auto id = uuid()) found = value::Value::string(id->string());
  } else if (key == "QSUserElection") {
    found = value::Value::string(electionText(*this));
  } else if (key == "QSExtensionContainingApp") {
    std::optional<std::string> containing = containingPath();
    if (!containing) return false;
    found = value::Value::string(*containing);
  } else {
    found = manifestValue(key);
  }

  if (auto flag = pattern.asBool())
    return *flag ? found && !isFalse(*found) : !found || isFalse(*found);
  if (!found) return false;
  if (const value::Dictionary* items = pattern.asDictionary())
    return matchDictionary(*found, *items);
  if (const std::string* text = found->asString()) return matchValuePatterns(*text, pattern);
  if (const value::Array* elements = found->asArray()) {
    for (const value::Value& element : *elements) {
      const std::string* text = element.asString();
      if (text && matchValuePatterns(*text, pattern)) return true;
    }
  }
  return false;
}

bool AXDPlugIn::matchValuePatterns(const std::string& value, const value::Value& patterns) const {
  if (const std::string* pattern = patterns.asString()) return matchValuePattern(value, *pattern);
  if (const value::Array* alternatives = patterns.asArray()) {
    for (const value::Value& alternative : *alternatives) {
      const std::string* pattern = alternative.asString();
      if (pattern && matchValuePattern(value, *pattern)) return true;
    }
  }
  return false;
}

bool AXDPlugIn::matchValuePattern(const std::string& value, const std::string& pattern) const {
  std::string_view text = pattern;
  if (text.starts_with(kConforms)) {
    return types::TypeRegistry::conforms(value, std::string(text.substr(kConforms.size())));
  }
  if (text.starts_with(kIs)) {
    return types::TypeRegistry::conforms(std::string(text.substr(kIs.size())), value);
  }
  if (text.starts_with("?")) {
    os::Log::notice("unrecognized match operator:%@", {pattern});
    return false;
  }
  for (const Operator& op : kOperators) {
    if (text.starts_with(op.prefix)) {
      return op.holds(compareVersionString(value, text.substr(op.prefix.size())));
    }
  }
  return compareVersionString(value, text) == 0;
}

bool AXDPlugIn::matchDictionary(const value::Value& value, const value::Dictionary& pattern) const {
  return types::ActivationRule::evaluate(value, pattern);
}
