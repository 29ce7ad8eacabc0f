// Thread safety: confined to one thread at a time, as are the objects.
//
// The little of SQLite that a suite needs, with its handles owned.
#pragma once

#include <sqlite3.h>

#include <cstdint>
#include <memory>
#include <string>

namespace spacekeep {

struct CloseDatabase {
  void operator()(sqlite3* database) const { sqlite3_close_v2(database); }
};
using Database = std::unique_ptr<sqlite3, CloseDatabase>;

struct FinalizeStatement {
  void operator()(sqlite3_stmt* statement) const { sqlite3_finalize(statement); }
};
using Statement = std::unique_ptr<sqlite3_stmt, FinalizeStatement>;

/// What SQLite last said of `database`, with the number of the result code.
[[nodiscard]] std::string sqliteText(sqlite3* database, int code);

/// Null when `sql` cannot be prepared; the code is then with the database.
[[nodiscard]] Statement prepare(sqlite3* database, const char* sql);

/// Runs statements that answer nothing. SQLITE_OK or the error.
[[nodiscard]] int execute(sqlite3* database, const char* sql);

/// The first column of the first row as an integer; `code` is SQLITE_ROW then, else the error.
[[nodiscard]] std::int64_t queryInteger(sqlite3* database, const char* sql, int& code);

/// The file's content is not what SQLite writes, as opposed to: cannot be reached just now.
[[nodiscard]] bool meansDamage(int code);

/// No block, inode or quota is left for what was to be written. To be asked right after the error.
[[nodiscard]] bool meansNoRoom(sqlite3* database, int code);

}  // namespace spacekeep
