#pragma once

#include "platform/os/Error.h"
#include "platform/registrum/Database.h"

namespace registrum {

// The registry's tables (docs/platform.md shows them): applications, plug-ins, the change log
// and the schema version. Stateless.
class Schema {
 public:
  static constexpr int kVersion = 1;
  // The change log keeps this many newest entries; older ones are trimmed at each change.
  static constexpr int kChangesKept = 1000;

  // Creates the tables in |db| when they are missing, in one transaction, so that processes
  // opening a new database at once agree. Fails with EIO for a database of another version.
  static os::Status ensure(Database& db);
};

}  // namespace registrum
