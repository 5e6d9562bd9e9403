#include "platform/registrum/Database.h"

namespace registrum {

os::Result<std::unique_ptr<Database>> Database::open(const std::string& path) {
  sqlite3* db = nullptr;
  int rc = sqlite3_open_v2(path.c_str(), &db, SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE, nullptr);
  if (rc != SQLITE_OK) {
    std::string message = "cannot open registry database " + path + ": " +
                          (db ? sqlite3_errmsg(db) : sqlite3_errstr(rc));
    int errnum = sqlite3_system_errno(db);
    sqlite3_close(db);
    return os::Error{errnum ? errnum : EIO, message};
  }
  std::unique_ptr<Database> database(new Database(db));
  sqlite3_busy_timeout(db, kBusyTimeoutMs);
  os::Status pragmas = database->execute(
      "PRAGMA journal_mode=WAL; PRAGMA synchronous=NORMAL; PRAGMA foreign_keys=ON; "
      "PRAGMA mmap_size=268435456;");
  if (!pragmas.ok()) return pragmas.error();
  return database;
}

Database::~Database() {
  releaseMemory();
  sqlite3_close(db_);
}

os::Result<Statement> Database::prepare(const std::string& sql) {
  auto cached = statements_.find(sql);
  if (cached != statements_.end()) return Statement(cached->second, db_);
  sqlite3_stmt* statement = nullptr;
  if (sqlite3_prepare_v3(db_, sql.c_str(), -1, SQLITE_PREPARE_PERSISTENT, &statement, nullptr) !=
      SQLITE_OK) {
    return error("cannot prepare \"" + sql + "\"");
  }
  statements_.emplace(sql, statement);
  return Statement(statement, db_);
}

os::Status Database::execute(const std::string& sql) {
  char* message = nullptr;
  int rc = sqlite3_exec(db_, sql.c_str(), nullptr, nullptr, &message);
  if (rc == SQLITE_OK) return os::success();
  std::string text = message ? message : sqlite3_errstr(rc);
  sqlite3_free(message);
  int errnum = EIO;
  if (rc == SQLITE_BUSY || rc == SQLITE_LOCKED) errnum = EBUSY;
  if (rc == SQLITE_NOTADB || rc == SQLITE_CORRUPT) errnum = kNotADatabase;
  return os::Error{errnum, "registry database: " + text};
}

os::Status Database::transaction(const std::function<os::Status()>& body) {
  os::Status begun = execute("BEGIN IMMEDIATE");
  if (!begun.ok()) return begun;
  os::Status outcome = body();
  if (outcome.ok()) outcome = execute("COMMIT");
  if (!outcome.ok()) execute("ROLLBACK");
  return outcome;
}

os::Result<Database::Version> Database::version() {
  os::Result<Statement> pragma = prepare("PRAGMA data_version");
  if (!pragma.ok()) return pragma.error();
  os::Result<bool> row = pragma.value().step();
  if (!row.ok()) return row.error();
  if (!row.value()) return error("PRAGMA data_version");
  return Version{pragma.value().integer(0), sqlite3_total_changes64(db_)};
}

void Database::releaseMemory() {
  for (auto& [sql, statement] : statements_) sqlite3_finalize(statement);
  statements_.clear();
  sqlite3_db_release_memory(db_);
}

os::Error Database::error(const std::string& what) const {
  int rc = sqlite3_errcode(db_);
  int errnum = (rc == SQLITE_NOTADB || rc == SQLITE_CORRUPT) ? kNotADatabase : EIO;
  return os::Error{errnum, "registry database: " + what + ": " + sqlite3_errmsg(db_)};
}

}  // namespace registrum
