// Owning handles for SQLite.
#pragma once

#include <sqlite3.h>

#include <memory>

namespace vesk {

struct CloseSQLite {
  void operator()(sqlite3* database) const noexcept { sqlite3_close_v2(database); }
};
using SQLiteDatabase = std::unique_ptr<sqlite3, CloseSQLite>;

struct FinalizeSQLite {
  void operator()(sqlite3_stmt* statement) const noexcept { sqlite3_finalize(statement); }
};
using SQLiteStatement = std::unique_ptr<sqlite3_stmt, FinalizeSQLite>;

/// Returns null if the text is not a valid statement for this database.
inline SQLiteStatement prepare(sqlite3* database, const char* text) noexcept {
  sqlite3_stmt* statement = nullptr;
  sqlite3_prepare_v2(database, text, -1, &statement, nullptr);
  return SQLiteStatement(statement);
}

}  // namespace vesk
