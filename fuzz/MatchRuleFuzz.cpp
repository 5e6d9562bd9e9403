// Matches a discovery rule against a daemon record: the input is a plug-in's Info.plist and a
// rule, property lists split at a "%%" line. The record is built as the daemon builds one from
// the registry (AXDPlugIn::initWithRGData), so every key a rule may name reads a fuzzed
// manifest. An empty rule, and a rule naming the plug-in's own identifier and UUID, always
// match. Seeds: fuzz/corpus/match/.

#include <cstdint>
#include <cstdlib>
#include <memory>
#include <span>

#include "FuzzInput.h"
#include "tests/plugin/RegistryRecords.h"

namespace {

// The record the daemon would build for a plug-in whose Info.plist is |info|.
std::shared_ptr<AXDPlugIn> recordFor(value::Dictionary info) {
  registrum::PlugInRecord::Fields fields =
      records::plugIn("/Applications/Host.app/PlugIns/Fuzzed.appex");
  const value::Value* plugIn = info.find("QSExtension");
  const value::Dictionary* dictionary = plugIn ? plugIn->asDictionary() : nullptr;
  fields.plugInDictionary = dictionary ? *dictionary : value::Dictionary();
  fields.infoDictionary = std::move(info);
  return records::build(std::move(fields));
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  auto [infoBytes, ruleBytes] = fuzz::splitInput(std::span(data, size));
  auto info = fuzz::readDictionary(infoBytes);
  auto rule = fuzz::readDictionary(ruleBytes);
  if (!info || !rule) return 0;
  std::shared_ptr<AXDPlugIn> plugIn = recordFor(std::move(*info));
  if (!plugIn) return 0;
  plugIn->match(*rule);
  value::Dictionary own{{"QSExtensionIdentifier", value::Value::string(records::kIdentifier)},
                        {AXD_VENDOR_PREFIX ".uuid",
                         value::Value::string(plugIn->uuid().value_or(value::Uuid()).string())}};
  if (!plugIn->match(std::nullopt) || !plugIn->match(value::Dictionary{}) || !plugIn->match(own)) {
    std::abort();
  }
  return 0;
}
