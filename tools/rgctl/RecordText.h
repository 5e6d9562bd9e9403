#pragma once

#include <string>

#include "platform/registrum/ApplicationRecord.h"
#include "platform/registrum/PlugInRecord.h"

// The text forms of registry records that rgctl prints; absent fields print as "-".
class RecordText {
 public:
  // "app IDENTIFIER VERSION PATH", with " (placeholder)" for a placeholder.
  static std::string applicationLine(const registrum::ApplicationRecord& application);
  // "plug-in IDENTIFIER VERSION UUID PATH".
  static std::string plugInLine(const registrum::PlugInRecord& record);
  // One "name: value" line per field; dictionaries as JSON.
  static std::string plugInDetails(const registrum::PlugInRecord& record);
  static std::string applicationDetails(const registrum::ApplicationRecord& application);
  // The notice line "INSTALLED:" or "UNINSTALLED:" then "BUNDLE-ID PLUGIN-ID(VERSION) UUID
  // PATH", as the daemon logs it.
  static std::string noticeLine(const char* event, const registrum::PlugInRecord& record);
};
