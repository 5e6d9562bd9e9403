#include "platform/registrum/Statement.h"

#include <cerrno>

namespace registrum {

Statement::~Statement() {
  if (!statement_) return;
  sqlite3_reset(statement_);
  sqlite3_clear_bindings(statement_);
}

Statement& Statement::bind(int index, std::string_view text) {
  sqlite3_bind_text(statement_, index, text.data(), static_cast<int>(text.size()),
                    SQLITE_TRANSIENT);
  return *this;
}

Statement& Statement::bind(int index, const std::optional<std::string>& text) {
  if (!text) {
    sqlite3_bind_null(statement_, index);
    return *this;
  }
  return bind(index, std::string_view(*text));
}

Statement& Statement::bind(int index, std::int64_t number) {
  sqlite3_bind_int64(statement_, index, number);
  return *this;
}

Statement& Statement::bind(int index, double number) {
  sqlite3_bind_double(statement_, index, number);
  return *this;
}

Statement& Statement::bind(int index, std::span<const std::uint8_t> blob) {
  sqlite3_bind_blob(statement_, index, blob.data(), static_cast<int>(blob.size()),
                    SQLITE_TRANSIENT);
  return *this;
}

os::Result<bool> Statement::step() {
  int rc = sqlite3_step(statement_);
  if (rc == SQLITE_ROW) return true;
  if (rc == SQLITE_DONE) return false;
  int errnum = (rc == SQLITE_BUSY || rc == SQLITE_LOCKED) ? EBUSY : EIO;
  return os::Error{errnum, std::string("registry database: ") + sqlite3_errmsg(db_)};
}

os::Status Statement::run() {
  for (;;) {
    os::Result<bool> row = step();
    if (!row.ok()) return row.error();
    if (!row.value()) return os::success();
  }
}

bool Statement::isNull(int column) const {
  return sqlite3_column_type(statement_, column) == SQLITE_NULL;
}

std::string Statement::text(int column) const {
  const unsigned char* bytes = sqlite3_column_text(statement_, column);
  int size = sqlite3_column_bytes(statement_, column);
  return bytes ? std::string(reinterpret_cast<const char*>(bytes), size) : std::string();
}

std::optional<std::string> Statement::optionalText(int column) const {
  if (isNull(column)) return std::nullopt;
  return text(column);
}

std::int64_t Statement::integer(int column) const {
  return sqlite3_column_int64(statement_, column);
}

double Statement::real(int column) const {
  return sqlite3_column_double(statement_, column);
}

std::span<const std::uint8_t> Statement::blob(int column) const {
  const void* bytes = sqlite3_column_blob(statement_, column);
  int size = sqlite3_column_bytes(statement_, column);
  if (!bytes) return {};
  return {static_cast<const std::uint8_t*>(bytes), static_cast<std::size_t>(size)};
}

}  // namespace registrum
