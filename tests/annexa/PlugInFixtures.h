#pragma once

#include <initializer_list>
#include <memory>
#include <optional>
#include <string>

#include "Annexa/AXFileURL.h"
#include "Annexa/AXPlugInCore.h"
#include "platform/value/Dictionary.h"
#include "platform/value/Value.h"

// Short builders for the manifests and records of the plug-in record tests.
namespace fixtures {

inline value::Value S(std::string text) {
  return value::Value::string(std::move(text));
}
inline value::Value I(std::int64_t number) {
  return value::Value::integer(number);
}
inline value::Value B(bool flag) {
  return value::Value::boolean(flag);
}
inline value::Value D(std::initializer_list<value::Dictionary::Entry> entries) {
  return value::Value::dictionary(value::Dictionary(entries));
}
inline value::Value A(std::initializer_list<value::Value> elements) {
  return value::Value::array(value::Array(elements));
}

inline constexpr const char* kAppexPath = "/Apps/Host.app/PlugIns/Tool.appex";
inline constexpr const char* kBundlePath = "/System/Library/Tool.bundle";

// A bundle information dictionary whose "QSExtension" is |plugIn|.
inline value::Value manifest(value::Value plugIn) {
  return D({{"QFBundleIdentifier", S("com.example.tool")}, {"QSExtension", std::move(plugIn)}});
}

// A set-up record of the plug-in at |path| with bundle information |info|.
inline std::shared_ptr<AXPlugInCore> record(const std::string& path, value::Value info) {
  return AXPlugInCore::initWithName("com.example.tool", AXFileURL(path), std::move(info),
                                    std::nullopt, std::nullopt);
}

}  // namespace fixtures
