#include "tools/collector/store/Database.h"

#include <fmt/format.h>

#include <utility>

namespace orvanta::collector {

Statement& Statement::bind(int index, std::int64_t value) {
  sqlite3_bind_int64(_statement.get(), index + 1, value);
  return *this;
}

Statement& Statement::bind(int index, double value) {
  sqlite3_bind_double(_statement.get(), index + 1, value);
  return *this;
}

// SQLITE_STATIC: not copied, see the header.
Statement& Statement::bindText(int index, std::string_view text) {
  sqlite3_bind_text64(_statement.get(), index + 1, text.data() != nullptr ? text.data() : "", text.size(),
                      SQLITE_STATIC, SQLITE_UTF8);
  return *this;
}

Statement& Statement::bindBlob(int index, std::string_view bytes) {
  sqlite3_bind_blob64(_statement.get(), index + 1, bytes.data() != nullptr ? bytes.data() : "", bytes.size(),
                      SQLITE_STATIC);
  return *this;
}

Statement& Statement::bindNull(int index) {
  sqlite3_bind_null(_statement.get(), index + 1);
  return *this;
}

bool Statement::step() {
  if (!_statement) return false;
  if (sqlite3_step(_statement.get()) == SQLITE_ROW) return true;
  reset();
  return false;
}

void Statement::reset() {
  sqlite3_reset(_statement.get());
  sqlite3_clear_bindings(_statement.get());
}

std::int64_t Statement::integer(int column) const {
  return sqlite3_column_int64(_statement.get(), column);
}

double Statement::real(int column) const {
  return sqlite3_column_double(_statement.get(), column);
}

std::string Statement::bytes(int column) const {
  const auto* data = static_cast<const char*>(sqlite3_column_blob(_statement.get(), column));
  const int size = sqlite3_column_bytes(_statement.get(), column);
  return data != nullptr ? std::string(data, static_cast<std::size_t>(size)) : std::string();
}

bool Statement::isNull(int column) const {
  return sqlite3_column_type(_statement.get(), column) == SQLITE_NULL;
}

Result<std::unique_ptr<Database>> Database::open(const std::string& path, const char* schema) {
  sqlite3* handle = nullptr;
  const int flags = SQLITE_OPEN_READWRITE | SQLITE_OPEN_CREATE | SQLITE_OPEN_NOMUTEX;
  const int opened = sqlite3_open_v2(path.c_str(), &handle, flags, nullptr);
  std::unique_ptr<Database> database(new Database(handle));
  if (opened != SQLITE_OK) return Failure{fmt::format("cannot open {}: {}", path, sqlite3_errstr(opened))};
  // Readers such as the sqlite3 program may have it open while the collector writes.
  sqlite3_busy_timeout(handle, 5000);
  if (sqlite3_exec(handle, "PRAGMA journal_mode=WAL; PRAGMA synchronous=OFF;", nullptr, nullptr, nullptr) !=
          SQLITE_OK ||
      sqlite3_exec(handle, schema, nullptr, nullptr, nullptr) != SQLITE_OK) {
    return Failure{fmt::format("cannot use {}: {}", path, sqlite3_errmsg(handle))};
  }
  return database;
}

Statement Database::prepare(std::string_view sql) {
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v3(_handle.get(), sql.data(), static_cast<int>(sql.size()), SQLITE_PREPARE_PERSISTENT, &statement,
                     nullptr);
  return Statement(statement);
}

void Database::run(const char* sql) {
  sqlite3_exec(_handle.get(), sql, nullptr, nullptr, nullptr);
}

}  // namespace orvanta::collector
