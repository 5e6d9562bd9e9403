#include "platform/registrum/RecordFields.h"

#include "platform/sdk/SdkMerge.h"

namespace registrum {

namespace {

constexpr std::string_view kPointKey = "QSExtensionPointIdentifier";

std::optional<std::string> firstString(const value::Dictionary& dictionary, std::string_view a,
                                       std::string_view b) {
  std::optional<std::string> found = RecordFields::string(dictionary, a);
  return found ? found : RecordFields::string(dictionary, b);
}

}  // namespace

std::optional<std::string> RecordFields::string(const value::Dictionary& dictionary,
                                                std::string_view key) {
  const value::Value* found = dictionary.find(key);
  const std::string* text = found ? found->asString() : nullptr;
  if (!text) return std::nullopt;
  return *text;
}

void RecordFields::derive(PlugInRecord::Fields& fields) {
  const value::Dictionary& info = fields.infoDictionary;
  fields.plugInIdentifier = string(fields.plugInDictionary, "QSExtensionIdentifier");
  if (!fields.plugInIdentifier) fields.plugInIdentifier = string(info, "QFBundleIdentifier");
  fields.originalIdentifier = fields.plugInIdentifier;
  fields.bundleIdentifier = string(info, "QFBundleIdentifier");
  fields.bundleVersion = string(info, "QFBundleShortVersionString");
  std::optional<value::Value> version =
      PlugInRecord(fields).valueForKey("QSExtensionVersion", PlugInRecord::Scope::Attributes);
  fields.plugInVersion = version ? sdk::versionText(*version) : std::nullopt;
  fields.extensionPointIdentifier = string(fields.plugInDictionary, kPointKey);
  fields.localizedName = firstString(info, "QFBundleDisplayName", "QFBundleName");
  fields.localizedShortName = firstString(info, "QFBundleName", "QFBundleDisplayName");
}

ApplicationRecord::Fields RecordFields::application(std::string path, const value::Dictionary& info,
                                                    bool placeholder) {
  return ApplicationRecord::Fields{
      .path = std::move(path),
      .bundleIdentifier = string(info, "QFBundleIdentifier"),
      .bundleVersion = string(info, "QFBundleShortVersionString"),
      .localizedName = firstString(info, "QFBundleDisplayName", "QFBundleName"),
      .placeholder = placeholder,
  };
}

std::optional<std::string> RecordFields::rulePoint(const PlugInRecord::Fields& fields) {
  std::optional<value::Value> found = PlugInRecord(fields).manifestValue(kPointKey);
  if (!found || !found->asString()) return std::nullopt;
  return *found->asString();
}

}  // namespace registrum
