#pragma once

#include <sqlite3.h>

#include <cerrno>
#include <functional>
#include <map>
#include <memory>
#include <string>

#include "platform/os/Error.h"
#include "platform/registrum/Statement.h"

namespace registrum {

// One SQLite connection in WAL mode with a busy timeout and a cache of prepared statements.
// Not thread-safe: its owner serialises every use (the Store's mutex, or the notice thread that
// owns the connection).
class Database {
 public:
  // How long a statement waits for another connection's write lock before failing with EBUSY.
  static constexpr int kBusyTimeoutMs = 10000;
  // The errnum of a failure because the file is no SQLite database, or a damaged one.
  static constexpr int kNotADatabase = EBADMSG;

  // Opens (creating when missing) the database file at |path| and switches it to WAL mode.
  // Fails with kNotADatabase for a file that is no (intact) SQLite database, EIO and SQLite's
  // message, or ENOENT/EACCES-like errors of the file.
  static os::Result<std::unique_ptr<Database>> open(const std::string& path);

  ~Database();
  Database(const Database&) = delete;
  Database& operator=(const Database&) = delete;

  // The statement for |sql|, prepared once and then reused. Fails with EIO for bad SQL.
  os::Result<Statement> prepare(const std::string& sql);

  // Runs |sql| (several statements allowed) without results. Fails with EBUSY when the database
  // stayed locked, kNotADatabase when it is damaged, EIO otherwise.
  os::Status execute(const std::string& sql);

  // Runs |body| inside BEGIN IMMEDIATE ... COMMIT; rolls back when |body| or the commit fails
  // and returns that failure. Not re-entrant.
  os::Status transaction(const std::function<os::Status()>& body);

  // What the database holds, as this connection can tell without reading it: PRAGMA
  // data_version, which other connections' commits move, and the rows this connection has
  // changed. Equal versions mean equal contents (a rolled-back change moves it too, which only
  // costs a reader a fresh read). Fails with EIO.
  struct Version {
    std::int64_t others = 0;
    std::int64_t own = 0;
    bool operator==(const Version&) const = default;
  };
  os::Result<Version> version();

  // Finalises the cached statements and returns the connection's spare memory to the system.
  void releaseMemory();

 private:
  explicit Database(sqlite3* db) : db_(db) {}

  os::Error error(const std::string& what) const;

  sqlite3* db_;
  std::map<std::string, sqlite3_stmt*> statements_;
};

}  // namespace registrum
