#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <tuple>
#include <vector>

#include "platform/os/Error.h"
#include "platform/registrum/Database.h"
#include "platform/registrum/Observer.h"
#include "platform/registrum/Sources.h"

namespace registrum {

// The registry's rows over one database connection: reads and writes of applications, plug-ins
// and the change log. A plug-in row holds the bundle's own Info.plist; each read resolves its
// plug-in dictionary against the SDKs, and judges its entitlements by the trusted keys, as they are
// then (one Sources::refresh() per read, so no system call per row). Not thread-safe: its owner
// serialises every call (Workspace's mutex, or the notice thread that owns its own Store). Writes
// that belong together run inside database().transaction().
class Store {
 public:
  enum class ChangeKind : std::int64_t { Install = 1, Uninstall = 2 };

  struct Change {
    std::int64_t sequence = 0;
    ChangeKind kind = ChangeKind::Install;
    std::vector<std::uint8_t> records;  // RecordCodec::encodeList
  };

  // What a plug-in row says without decoding its dictionaries: enough to find, replace or remove
  // a row that no longer decodes. |uuid| is the column's text as stored.
  struct PlugInKey {
    std::string uuid;
    std::string path;
    std::optional<std::string> dataContainer;
  };

  // Which plug-ins plugIns() returns; every unset criterion admits all.
  struct Selection {
    std::optional<std::string> plugInIdentifier;
    // Also admits plug-ins without a pre-selection extension point.
    std::optional<std::string> rulePoint;
    bool excludePlaceholders = true;
  };

  // Opens the database file at |path| and makes sure its schema is in place. Plug-in rows are
  // resolved against |sources|, which the store shares. A file that is no database, holds another
  // program's tables or has a later schema version is renamed to "<path>.damaged-<seconds>",
  // with its -wal and -shm and the paths |keptWith| (what belongs to its records), logged, and
  // replaced by an empty database.
  static os::Result<std::unique_ptr<Store>> open(const std::string& path,
                                                 std::shared_ptr<Sources> sources,
                                                 const std::vector<std::string>& keptWith = {});

  Database& database() { return *db_; }

  // Lookups: a null pointer when there is no such row. A damaged row (one whose UUID or
  // dictionaries do not decode) is left out of every lookup and list, as if absent; the first
  // time this Store meets it, it logs one line naming it.
  os::Result<std::shared_ptr<const ApplicationRecord>> application(const std::string& path);
  os::Result<std::shared_ptr<const PlugInRecord>> plugInByUuid(const value::Uuid& uuid);
  os::Result<std::shared_ptr<const PlugInRecord>> plugInByPath(const std::string& path);
  os::Result<PlugInList> plugInsOfApplication(const std::string& path);
  os::Result<std::vector<std::shared_ptr<const ApplicationRecord>>> applications();
  // The plug-ins |selection| admits, ordered by path. The same list, the same records, while
  // neither the database (Database::version) nor the SDKs changed since it was read: one
  // version check per call, no row read.
  os::Result<PlugInList> plugIns(const Selection& selection);
  // The keys of the rows the lookups above leave out as damaged, in path order.
  os::Result<std::vector<PlugInKey>> damagedPlugIns();
  // The key of the plug-in row at |path| (damaged or not); nothing when there is none.
  os::Result<std::optional<PlugInKey>> plugInKeyAtPath(const std::string& path);
  // The keys of every plug-in row of the application at |path| (damaged or not).
  os::Result<std::vector<PlugInKey>> plugInKeysOfApplication(const std::string& path);
  // The UUID text of every plug-in row, damaged or not.
  os::Result<std::vector<std::string>> plugInUuids();

  // Inserts or updates the row of |fields|.path (applications) or |fields|.uuid (plug-ins). A
  // plug-in's stored identifier and extension point are derived from |fields| as given, so the
  // caller passes the bundle's own plug-in dictionary, not a resolved one.
  os::Status putApplication(const ApplicationRecord::Fields& fields);
  os::Status putPlugIn(const PlugInRecord::Fields& fields);
  // Deletes the plug-in row at |path| without reading it; success when there is none.
  os::Status deletePlugInAtPath(const std::string& path);
  // Deletes the application at |path| and every plug-in row that names it.
  os::Status deleteApplication(const std::string& path);

  // Appends a change-log entry and trims the log to Schema::kChangesKept entries.
  os::Status appendChange(ChangeKind kind, const PlugInList& records);
  // The newest change's sequence number; 0 for an empty log.
  os::Result<std::int64_t> lastSequence();
  // Up to |limit| changes after |sequence|, oldest first.
  os::Result<std::vector<Change>> changesAfter(std::int64_t sequence, int limit);

 private:
  Store(std::unique_ptr<Database> db, std::shared_ptr<Sources> sources)
      : db_(std::move(db)), sources_(std::move(sources)) {}

  os::Result<std::shared_ptr<const PlugInRecord>> onePlugIn(const std::string& where,
                                                            const std::string& key);
  // The plug-ins |selection| admits, filtered from the kept list of every plug-in: a selection by
  // extension point alone then costs a pass over records already read, not a query that decodes
  // every row again. Nothing when no such list is kept, or the selection names an identifier,
  // which the index answers faster.
  std::optional<PlugInList> selectKept(const Selection& selection) const;
  // plugIns() read from the database.
  os::Result<PlugInList> readPlugIns(const Selection& selection);
  os::Result<PlugInList> plugInRows(Statement& statement);
  os::Result<std::vector<PlugInKey>> plugInKeys(const std::string& where, const std::string& key);
  // Logs |error| about a damaged row once per row and Store.
  void reportDamaged(const std::string& uuid, const os::Error& error);
  // The record of |row|, resolved against the SDKs of |sdkGeneration|.
  // |previous|, when given, is the application record of the row before; a row of the same
  // application shares it, and it becomes this row's otherwise.
  os::Result<std::shared_ptr<const PlugInRecord>> plugInRow(
      const Statement& row, std::uint64_t sdkGeneration,
      std::shared_ptr<const ApplicationRecord>* previous = nullptr);
  // Fills the signature of |fields| from |row| and the entitlements it honours, judged by the
  // trust store as it is now.
  void judge(const Statement& row, PlugInRecord::Fields& fields);
  static std::shared_ptr<const ApplicationRecord> applicationRow(const Statement& row, int first);

  // The lists plugIns() returned, by selection, and what they were read at: reused while the
  // database's version and the SDK generation stay, so a registry that did not change is not
  // read again for every discovery.
  struct Snapshot {
    Database::Version version;
    std::uint64_t sdkGeneration = 0;
    std::map<std::tuple<std::optional<std::string>, std::optional<std::string>, bool>, PlugInList>
        lists;
  };
  // At most this many selections are kept; one more starts the snapshot afresh.
  static constexpr std::size_t kMaxSnapshotLists = 64;

  std::unique_ptr<Database> db_;
  const std::shared_ptr<Sources> sources_;
  std::set<std::string> reportedDamaged_;
  Snapshot snapshot_;
};

}  // namespace registrum
