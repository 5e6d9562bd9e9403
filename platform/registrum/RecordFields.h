#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/registrum/ApplicationRecord.h"
#include "platform/registrum/PlugInRecord.h"

namespace registrum {

// The fields of registry records that follow from a bundle's dictionaries alone, so that the
// database stores each fact once. Stateless; safe to call from any thread.
class RecordFields {
 public:
  // |dictionary|[|key|] when it is a string; nothing otherwise.
  static std::optional<std::string> string(const value::Dictionary& dictionary,
                                           std::string_view key);

  // Fills the identifiers, versions, extension point and names of |fields| from its
  // infoDictionary and plugInDictionary (see PlugInRecord for each rule).
  static void derive(PlugInRecord::Fields& fields);

  // The record of the application at |path| whose Info.plist is |info|.
  static ApplicationRecord::Fields application(std::string path, const value::Dictionary& info,
                                               bool placeholder);

  // The extension point that a match-rule entry "QSExtensionPointIdentifier" sees: the
  // plug-in's manifestValue of that name when it is a string. Nothing when that value is not a
  // string or none is present, which pre-selection treats as "may match".
  static std::optional<std::string> rulePoint(const PlugInRecord::Fields& fields);
};

}  // namespace registrum
