#include "tools/rgctl/RecordJson.h"

#include "tools/axctl/ValueJson.h"

namespace {

using nlohmann::ordered_json;

ordered_json optional(const std::optional<std::string>& text) {
  return text ? ordered_json(*text) : ordered_json(nullptr);
}

ordered_json dictionary(const value::Dictionary& entries) {
  return toJson(value::Value::dictionary(entries));
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
      {"entitlements", dictionary(record.entitlements())},
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
