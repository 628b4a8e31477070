#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "interface/Values.h"

namespace orvanta::collector {

// One prepared statement. Parameters and columns count from 0. Not thread-safe: the owner of the database locks.
//
// Bound texts and blobs are not copied: they must live until the step that reads them.
class Statement {
 public:
  Statement() = default;
  explicit Statement(sqlite3_stmt* statement) : _statement(statement, &sqlite3_finalize) {}

  Statement& bind(int index, std::int64_t value);
  Statement& bind(int index, double value);
  Statement& bindText(int index, std::string_view text);
  Statement& bindBlob(int index, std::string_view bytes);
  Statement& bindNull(int index);
  // Returns whether there was a row. After the last row, or on failure, the statement is ready for its next use.
  bool step();
  // Drops the remaining rows.
  void reset();

  std::int64_t integer(int column) const;
  double real(int column) const;
  std::string bytes(int column) const;  // text or blob
  bool isNull(int column) const;

 private:
  std::unique_ptr<sqlite3_stmt, int (*)(sqlite3_stmt*)> _statement{nullptr, &sqlite3_finalize};
};

// A SQLite database file. Not thread-safe: the owner locks. Only open() reports failures: the SQL is the program's own,
// and records that cannot be written, such as to a full disk, are lost.
class Database {
 public:
  // Opens or creates the file and runs the schema. The failure names the file.
  static Result<std::unique_ptr<Database>> open(const std::string& path, const char* schema);

  // SQL that does not compile gives a statement that never has a row.
  Statement prepare(std::string_view sql);
  void run(const char* sql);
  std::int64_t lastInsertId() const { return sqlite3_last_insert_rowid(_handle.get()); }

 private:
  explicit Database(sqlite3* handle) : _handle(handle, &sqlite3_close) {}
  std::unique_ptr<sqlite3, int (*)(sqlite3*)> _handle{nullptr, &sqlite3_close};
};

}  // namespace orvanta::collector
