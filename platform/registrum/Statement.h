#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/os/Error.h"

namespace registrum {

// One use of a prepared statement owned by a Database: parameters are bound, rows stepped
// through, and the statement is reset and its bindings cleared when this object goes away. Not
// thread-safe: it belongs to the thread that holds its Database.
class Statement {
 public:
  Statement(sqlite3_stmt* statement, sqlite3* db) : statement_(statement), db_(db) {}
  ~Statement();
  Statement(Statement&& other) noexcept
      : statement_(std::exchange(other.statement_, nullptr)), db_(other.db_) {}
  Statement(const Statement&) = delete;
  Statement& operator=(const Statement&) = delete;

  // Binders take 1-based parameter indices, as SQLite counts them; nothing binds NULL.
  Statement& bind(int index, std::string_view text);
  Statement& bind(int index, const std::string& text) {
    return bind(index, std::string_view(text));
  }
  Statement& bind(int index, const std::optional<std::string>& text);
  Statement& bind(int index, std::int64_t number);
  Statement& bind(int index, double number);
  Statement& bind(int index, std::span<const std::uint8_t> blob);

  // True when a row is ready, false when the statement is done; an error (EBUSY when the
  // database stayed locked past the busy timeout, EIO otherwise) on failure.
  os::Result<bool> step();
  // Steps until done, for statements that return no rows.
  os::Status run();

  // Column readers for the current row, 0-based.
  bool isNull(int column) const;
  std::string text(int column) const;
  std::optional<std::string> optionalText(int column) const;
  std::int64_t integer(int column) const;
  double real(int column) const;
  std::span<const std::uint8_t> blob(int column) const;

 private:
  sqlite3_stmt* statement_;
  sqlite3* db_;
};

}  // namespace registrum
