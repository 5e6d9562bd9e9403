#include "platform/registrum/Schema.h"

#include <cerrno>
#include <iterator>

namespace registrum {

namespace {

constexpr const char* kTables = R"sql(
CREATE TABLE IF NOT EXISTS schema_version (version INTEGER NOT NULL);
CREATE TABLE IF NOT EXISTS applications (
  path TEXT PRIMARY KEY,
  bundle_identifier TEXT,
  bundle_version TEXT,
  localized_name TEXT,
  placeholder INTEGER NOT NULL
);
CREATE TABLE IF NOT EXISTS plugins (
  uuid TEXT PRIMARY KEY,
  path TEXT NOT NULL UNIQUE,
  application_path TEXT REFERENCES applications(path),
  plugin_identifier TEXT,
  rule_point TEXT,
  registration_date REAL NOT NULL,
  on_system_partition INTEGER NOT NULL,
  data_container TEXT,
  entitlements BLOB NOT NULL,
  info BLOB NOT NULL,
  signature TEXT NOT NULL DEFAULT 'unsigned',
  signer TEXT,
  signature_note TEXT,
  executable_digest TEXT
);
CREATE INDEX IF NOT EXISTS plugins_by_identifier ON plugins(plugin_identifier);
CREATE INDEX IF NOT EXISTS plugins_by_rule_point ON plugins(rule_point);
CREATE INDEX IF NOT EXISTS plugins_by_application ON plugins(application_path);
CREATE TABLE IF NOT EXISTS changes (
  sequence INTEGER PRIMARY KEY AUTOINCREMENT,
  kind INTEGER NOT NULL,
  records BLOB NOT NULL
);
)sql";

// What brings a database of version i + 1 to version i + 2.
constexpr const char* kMigrations[] = {
    // The plug-in dictionary is resolved against the SDKs at every read, so that an SDK added,
    // changed or removed later counts; the copy resolved at registration goes.
    "ALTER TABLE plugins DROP COLUMN plugin_dictionary",
    // What verifying the bundle's signature found when it was registered; a row of version 2
    // was never verified, so it counts as unsigned until the bundle is registered again.
    "ALTER TABLE plugins ADD COLUMN signature TEXT NOT NULL DEFAULT 'unsigned';"
    "ALTER TABLE plugins ADD COLUMN signer TEXT;"
    "ALTER TABLE plugins ADD COLUMN signature_note TEXT;"
    "ALTER TABLE plugins ADD COLUMN executable_digest TEXT",
};
static_assert(std::size(kMigrations) == Schema::kVersion - 1);

os::Status migrate(Database& db, std::int64_t version) {
  for (std::int64_t step = version; step < Schema::kVersion; ++step) {
    os::Status migrated = db.execute(kMigrations[step - 1]);
    if (!migrated.ok()) return migrated;
  }
  os::Result<Statement> update = db.prepare("UPDATE schema_version SET version = ?");
  if (!update.ok()) return update.error();
  return update.value().bind(1, std::int64_t{Schema::kVersion}).run();
}

os::Status checkVersion(Database& db) {
  os::Result<Statement> select = db.prepare("SELECT version FROM schema_version");
  if (!select.ok()) return select.error();
  os::Result<bool> row = select.value().step();
  if (!row.ok()) return row.error();
  if (!row.value()) {
    os::Result<Statement> insert = db.prepare("INSERT INTO schema_version (version) VALUES (?)");
    if (!insert.ok()) return insert.error();
    return insert.value().bind(1, std::int64_t{Schema::kVersion}).run();
  }
  std::int64_t version = select.value().integer(0);
  if (version == Schema::kVersion) return os::success();
  if (version >= 1 && version < Schema::kVersion) return migrate(db, version);
  return os::Error{Database::kNotADatabase,
                   "registry database has schema version " + std::to_string(version) +
                       ", this program reads version " + std::to_string(Schema::kVersion)};
}

// Whether the database holds tables but no schema version of ours: another program's file.
os::Result<bool> isForeign(Database& db) {
  os::Result<Statement> select = db.prepare(
      "SELECT (SELECT COUNT(*) FROM sqlite_master) > 0 AND "
      "(SELECT COUNT(*) FROM sqlite_master WHERE type = 'table' AND name = 'schema_version') = 0");
  if (!select.ok()) return select.error();
  os::Result<bool> row = select.value().step();
  if (!row.ok()) return row.error();
  return select.value().integer(0) != 0;
}

}  // namespace

os::Status Schema::ensure(Database& db) {
  return db.transaction([&]() -> os::Status {
    os::Result<bool> foreign = isForeign(db);
    if (!foreign.ok()) return foreign.error();
    if (foreign.value()) {
      return os::Error{Database::kNotADatabase, "registry database holds another program's tables"};
    }
    os::Status created = db.execute(kTables);
    if (!created.ok()) return created;
    return checkVersion(db);
  });
}

}  // namespace registrum
