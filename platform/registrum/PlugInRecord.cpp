#include "platform/registrum/PlugInRecord.h"

namespace registrum {

std::optional<value::Value> PlugInRecord::valueForKey(std::string_view key, Scope scope) const {
  const value::Dictionary* dictionary = &fields_.infoDictionary;
  if (scope == Scope::PlugInDictionary) dictionary = &fields_.plugInDictionary;
  if (scope == Scope::Attributes) {
    const value::Value* attributes = fields_.plugInDictionary.find("QSExtensionAttributes");
    dictionary = attributes ? attributes->asDictionary() : nullptr;
    if (!dictionary) return std::nullopt;
  }
  const value::Value* found = dictionary->find(key);
  if (!found) return std::nullopt;
  return *found;
}

std::optional<value::Value> PlugInRecord::manifestValue(std::string_view key) const {
  for (Scope scope : {Scope::Attributes, Scope::PlugInDictionary, Scope::InfoDictionary}) {
    if (std::optional<value::Value> found = valueForKey(key, scope)) return found;
  }
  return std::nullopt;
}

}  // namespace registrum
