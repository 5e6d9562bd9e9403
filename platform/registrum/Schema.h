#pragma once

#include "platform/os/Error.h"
#include "platform/registrum/Database.h"

namespace registrum {

// The registry's tables (docs/platform.md shows them): applications, plug-ins, the change log
// and the schema version. Stateless.
class Schema {
 public:
  // 2: plug-in rows keep no resolved plug-in dictionary.
  static constexpr int kVersion = 3;
  // The change log keeps this many newest entries; older ones are trimmed at each change.
  static constexpr int kChangesKept = 1000;

  // Creates the tables in |db| when they are missing and brings a database of an earlier version
  // to this one, in one transaction, so that processes opening a database at once agree. Fails
  // with Database::kNotADatabase for a database of a later (or unknown) version, or one that
  // holds tables but no schema version (another program's).
  static os::Status ensure(Database& db);
};

}  // namespace registrum
