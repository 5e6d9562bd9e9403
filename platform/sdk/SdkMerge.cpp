#include "platform/sdk/SdkMerge.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>
#include <map>

namespace sdk {

namespace {

using value::Value;

value::Array asList(const Value& resources) {
  if (const value::Array* array = resources.asArray()) return *array;
  if (resources.asString()) return {resources};
  return {};
}

Value mergeValue(std::string_view key, const Value& sdkValue, const Value& manifestValue) {
  if (sdkOverridesKey(key)) return sdkValue;
  if (key == "Shared") return mergeSharedResources(sdkValue, manifestValue);
  const value::Dictionary* sdkDictionary = sdkValue.asDictionary();
  const value::Dictionary* manifestDictionary = manifestValue.asDictionary();
  if (sdkDictionary && manifestDictionary) {
    return Value::dictionary(mergeDictionary(*sdkDictionary, *manifestDictionary));
  }
  return manifestValue;
}

}  // namespace

value::Dictionary mergeDictionary(const value::Dictionary& sdkSide,
                                  const value::Dictionary& manifestSide) {
  std::map<std::string, Value> merged = manifestSide.toMap();
  for (const auto& [key, sdkValue] : sdkSide) {
    auto found = merged.find(key);
    if (found == merged.end()) {
      merged.emplace(key, sdkValue);
    } else {
      found->second = mergeValue(key, sdkValue, found->second);
    }
  }
  return value::Dictionary(std::move(merged));
}

bool sdkOverridesKey(std::string_view key) {
  return key == "CleanTimeout";
}

Value mergeSharedResources(const Value& sdkSide, const Value& manifestSide) {
  value::Array merged;
  for (const value::Array& list : {asList(sdkSide), asList(manifestSide)}) {
    for (const Value& element : list) {
      if (std::find(merged.begin(), merged.end(), element) == merged.end()) {
        merged.push_back(element);
      }
    }
  }
  return Value::array(std::move(merged));
}

std::optional<std::string> versionText(const Value& version) {
  if (const std::string* text = version.asString()) return *text;
  if (std::optional<std::int64_t> signedNumber = version.asInt()) {
    return std::to_string(*signedNumber);
  }
  if (std::optional<std::uint64_t> unsignedNumber = version.asUInt()) {
    return std::to_string(*unsignedNumber);
  }
  std::optional<double> real = version.asReal();
  if (!real) return std::nullopt;
  // The shortest text that reads back as the same number: 1.5 stays "1.5", 2.0 becomes "2".
  std::array<char, 32> buffer;
  auto [end, error] = std::to_chars(buffer.data(), buffer.data() + buffer.size(), *real);
  if (error != std::errc()) return std::nullopt;
  return std::string(buffer.data(), end);
}

value::Dictionary canonicalize(const value::Dictionary& info) {
  const Value* plugIn = info.find("QSExtension");
  const value::Dictionary* plugInDictionary = plugIn ? plugIn->asDictionary() : nullptr;
  if (!plugInDictionary) return info;
  const Value* attributesValue = plugInDictionary->find("QSExtensionAttributes");
  const value::Dictionary* existing = attributesValue ? attributesValue->asDictionary() : nullptr;
  value::Dictionary attributes = existing ? *existing : value::Dictionary();
  const Value* version = attributes.find("QSExtensionVersion");
  if (version && version->isNumber()) {
    attributes = attributes.with("QSExtensionVersion", Value::string(*versionText(*version)));
  } else if (!version) {
    const Value* bundleVersion = info.find("QFBundleShortVersionString");
    bool usable = bundleVersion && bundleVersion->asString();
    attributes =
        attributes.with("QSExtensionVersion", usable ? *bundleVersion : Value::string("1"));
  }
  value::Dictionary completed =
      plugInDictionary->with("QSExtensionAttributes", Value::dictionary(attributes));
  return info.with("QSExtension", Value::dictionary(completed));
}

}  // namespace sdk
