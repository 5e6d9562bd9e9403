#include "tools/rgctl/RecordText.h"

#include <iomanip>
#include <sstream>

#include "platform/codesign/TrustStore.h"
#include "tools/axctl/ValueJson.h"

namespace {

std::string orDash(const std::optional<std::string>& text) {
  return text ? *text : "-";
}

std::string json(const value::Dictionary& dictionary) {
  return toJson(value::Value::dictionary(dictionary)).dump();
}

void field(std::ostringstream& out, const char* name, const std::string& text) {
  out << std::left << std::setw(22) << (std::string(name) + ":") << text << "\n";
}

}  // namespace

std::string RecordText::applicationLine(const registrum::ApplicationRecord& application) {
  return "app " + orDash(application.bundleIdentifier()) + " " +
         orDash(application.bundleVersion()) + " " + application.path() +
         (application.isPlaceholder() ? " (placeholder)" : "");
}

std::string RecordText::plugInLine(const registrum::PlugInRecord& record) {
  return "plug-in " + orDash(record.plugInIdentifier()) + " " + orDash(record.bundleVersion()) +
         " " + record.uuid().string() + " " + orDash(record.bundlePath());
}

std::string RecordText::plugInDetails(const registrum::PlugInRecord& record) {
  std::ostringstream out;
  const auto& application = record.containingApplication();
  field(out, "uuid", record.uuid().string());
  field(out, "path", orDash(record.bundlePath()));
  field(out, "application", application ? application->path() : "-");
  field(out, "placeholder", application && application->isPlaceholder() ? "yes" : "no");
  field(out, "identifier", orDash(record.plugInIdentifier()));
  field(out, "original identifier", orDash(record.originalIdentifier()));
  field(out, "bundle identifier", orDash(record.bundleIdentifier()));
  field(out, "version", orDash(record.bundleVersion()));
  field(out, "extension point", orDash(record.extensionPointIdentifier()));
  field(out, "localized name", orDash(record.localizedName()));
  field(out, "localized short name", orDash(record.localizedShortName()));
  std::ostringstream date;
  date << std::fixed << std::setprecision(6) << record.registrationDate();
  field(out, "registration date", date.str());
  field(out, "system partition", record.onSystemPartition() ? "yes" : "no");
  field(out, "data container", orDash(record.dataContainerPath()));
  const registrum::PlugInRecord::Fields::Signature& signature = record.signature();
  field(out, "signature", std::string(codesign::TrustStore::outcomeName(signature.outcome)));
  if (!signature.signer.empty()) field(out, "signer", signature.signer);
  if (!signature.distrust.empty()) field(out, "why", signature.distrust);
  field(out, "entitlements", json(record.entitlements()));
  field(out, "declared entitlements", json(record.declaredEntitlements()));
  field(out, "plug-in dictionary", json(record.plugInDictionary()));
  field(out, "info dictionary", json(record.infoDictionary()));
  return out.str();
}

std::string RecordText::applicationDetails(const registrum::ApplicationRecord& application) {
  std::ostringstream out;
  field(out, "path", application.path());
  field(out, "bundle identifier", orDash(application.bundleIdentifier()));
  field(out, "version", orDash(application.bundleVersion()));
  field(out, "localized name", orDash(application.localizedName()));
  field(out, "placeholder", application.isPlaceholder() ? "yes" : "no");
  return out.str();
}

std::string RecordText::noticeLine(const char* event, const registrum::PlugInRecord& record) {
  return std::string(event) + ":" + orDash(record.bundleIdentifier()) + " " +
         orDash(record.plugInIdentifier()) + "(" + orDash(record.bundleVersion()) + ") " +
         record.uuid().string() + " " + orDash(record.bundlePath());
}
