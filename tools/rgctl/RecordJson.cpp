#include "tools/rgctl/RecordJson.h"

#include "platform/codesign/TrustStore.h"
#include "tools/axctl/ValueJson.h"

namespace {

using nlohmann::ordered_json;

ordered_json optional(const std::optional<std::string>& text) {
  return text ? ordered_json(*text) : ordered_json(nullptr);
}

ordered_json dictionary(const value::Dictionary& entries) {
  return toJson(value::Value::dictionary(entries));
}

ordered_json signatureJson(const registrum::PlugInRecord::Fields::Signature& signature) {
  return {
      {"outcome", codesign::TrustStore::outcomeName(signature.outcome)},
      {"state", codesign::BundleSignature::stateName(signature.state)},
      {"signer", signature.signer.empty() ? ordered_json(nullptr) : ordered_json(signature.signer)},
      {"why",
       signature.distrust.empty() ? ordered_json(nullptr) : ordered_json(signature.distrust)},
      {"executableDigest", optional(signature.executableDigest)},
  };
}

}  // namespace

ordered_json RecordJson::brief(const registrum::PlugInRecord& record) {
  const auto& application = record.containingApplication();
  return {
      {"identifier", optional(record.plugInIdentifier())},
      {"version", optional(record.bundleVersion())},
      {"uuid", record.uuid().string()},
      {"path", optional(record.bundlePath())},
      {"application", application ? ordered_json(application->path()) : ordered_json(nullptr)},
      {"placeholder", application && application->isPlaceholder()},
  };
}

ordered_json RecordJson::full(const registrum::PlugInRecord& record) {
  const auto& application = record.containingApplication();
  return {
      {"uuid", record.uuid().string()},
      {"path", optional(record.bundlePath())},
      {"application", application ? RecordJson::application(*application) : ordered_json(nullptr)},
      {"identifier", optional(record.plugInIdentifier())},
      {"originalIdentifier", optional(record.originalIdentifier())},
      {"bundleIdentifier", optional(record.bundleIdentifier())},
      {"version", optional(record.bundleVersion())},
      {"extensionPoint", optional(record.extensionPointIdentifier())},
      {"localizedName", optional(record.localizedName())},
      {"localizedShortName", optional(record.localizedShortName())},
      {"registrationDate", record.registrationDate()},
      {"onSystemPartition", record.onSystemPartition()},
      {"dataContainer", optional(record.dataContainerPath())},
      {"signature", signatureJson(record.signature())},
      {"entitlements", dictionary(record.entitlements())},
      {"declaredEntitlements", dictionary(record.declaredEntitlements())},
      {"plugInDictionary", dictionary(record.plugInDictionary())},
      {"infoDictionary", dictionary(record.infoDictionary())},
  };
}

ordered_json RecordJson::application(const registrum::ApplicationRecord& record) {
  return {
      {"path", record.path()},
      {"bundleIdentifier", optional(record.bundleIdentifier())},
      {"version", optional(record.bundleVersion())},
      {"localizedName", optional(record.localizedName())},
      {"placeholder", record.isPlaceholder()},
  };
}
