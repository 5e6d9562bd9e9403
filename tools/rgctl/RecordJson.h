#pragma once

#include <nlohmann/json.hpp>

#include "platform/registrum/ApplicationRecord.h"
#include "platform/registrum/PlugInRecord.h"

// The JSON forms of registry records that rgctl prints. Absent fields are null.
class RecordJson {
 public:
  // Identifier, version, UUID, path and the containing application's path and placeholder flag.
  static nlohmann::ordered_json brief(const registrum::PlugInRecord& record);
  // Every field of the record, dictionaries included.
  static nlohmann::ordered_json full(const registrum::PlugInRecord& record);
  static nlohmann::ordered_json application(const registrum::ApplicationRecord& record);
};
