#pragma once

#include <initializer_list>
#include <memory>
#include <string>

#include "axd/AXDPlugIn.h"
#include "platform/registrum/ApplicationRecord.h"
#include "platform/registrum/PlugInRecord.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

// Registry records built by hand, and short value builders, for the daemon record's tests.
namespace records {

inline value::Value S(std::string text) {
  return value::Value::string(std::move(text));
}
inline value::Value D(std::initializer_list<value::Dictionary::Entry> entries) {
  return value::Value::dictionary(value::Dictionary(entries));
}
inline value::Value A(std::initializer_list<value::Value> elements) {
  return value::Value::array(value::Array(elements));
}

inline constexpr const char* kIdentifier = "com.example.tool";

// A well-formed plug-in at |path|, outside any application, with a data container.
inline registrum::PlugInRecord::Fields plugIn(std::string path) {
  registrum::PlugInRecord::Fields fields;
  fields.uuid = value::Uuid::random();
  fields.bundlePath = std::move(path);
  fields.plugInIdentifier = kIdentifier;
  fields.originalIdentifier = kIdentifier;
  fields.dataContainerPath = "/var/containers/" + fields.uuid.string();
  fields.plugInDictionary = value::Dictionary{
      {"QSExtensionProtocol", S("ToolProtocol")},
      {"QSExtensionAttributes", D({{"QSExtensionVersion", S("1.0")}})},
  };
  fields.infoDictionary = value::Dictionary{
      {"QFBundleIdentifier", S(kIdentifier)},
      {"QSExtension", value::Value::dictionary(fields.plugInDictionary)},
  };
  return fields;
}

inline std::shared_ptr<const registrum::ApplicationRecord> application(std::string path) {
  registrum::ApplicationRecord::Fields fields;
  fields.path = std::move(path);
  fields.bundleIdentifier = "com.example.host";
  fields.localizedName = "Host";
  return std::make_shared<const registrum::ApplicationRecord>(std::move(fields));
}

inline std::shared_ptr<AXDPlugIn> build(registrum::PlugInRecord::Fields fields) {
  return AXDPlugIn::initWithRGData(
      std::make_shared<const registrum::PlugInRecord>(std::move(fields)));
}

}  // namespace records
