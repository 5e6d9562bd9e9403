// Evaluates an activation rule against a host's items, both property lists (the input split at a
// "%%" line), with types::ActivationRule::evaluate, and asks TypeRegistry::conforms about every
// item against every type of the rule. Every type conforms to itself; a rule that accepts the
// items still accepts them when it lists each item's own type. Seeds: fuzz/corpus/activation/.

#include <cstdint>
#include <cstdlib>
#include <span>
#include <string>

#include "FuzzInput.h"
#include "platform/types/ActivationRule.h"
#include "platform/types/TypeRegistry.h"

namespace {

void checkConformances(const value::Dictionary& rule, const value::Array& items) {
  for (const value::Value& item : items) {
    const std::string* type = item.asString();
    if (!type) continue;
    if (!types::TypeRegistry::conforms(*type, *type)) std::abort();
    for (const auto& [to, count] : rule) types::TypeRegistry::conforms(*type, to);
  }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto [ruleBytes, itemBytes] = fuzz::splitInput(std::span(data, size));
  auto rule = value::PropertyList::read(ruleBytes);
  auto items = fuzz::readDictionary(itemBytes);
  if (!rule.ok() || !items) return 0;
  types::ActivationRule::evaluate(rule.value(), *items);
  const value::Value* list = items->find("items");
  const value::Array* array = list ? list->asArray() : nullptr;
  if (!array || !rule.value().asDictionary()) return 0;
  checkConformances(*rule.value().asDictionary(), *array);
  return 0;
}
