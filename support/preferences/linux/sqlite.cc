#include "support/preferences/linux/sqlite.h"

#include <cerrno>

namespace spacekeep {

std::string sqliteText(sqlite3* database, int code) {
  const char* words = database == nullptr ? sqlite3_errstr(code) : sqlite3_errmsg(database);
  return std::string(words) + " (SQLite " + std::to_string(code) + ")";
}

Statement prepare(sqlite3* database, const char* sql) {
  sqlite3_stmt* statement = nullptr;
  static_cast<void>(sqlite3_prepare_v2(database, sql, -1, &statement, nullptr));
  return Statement(statement);
}

int execute(sqlite3* database, const char* sql) {
  return sqlite3_exec(database, sql, nullptr, nullptr, nullptr);
}

std::int64_t queryInteger(sqlite3* database, const char* sql, int& code) {
  const Statement statement = prepare(database, sql);
  code = statement ? sqlite3_step(statement.get()) : sqlite3_extended_errcode(database);
  return code == SQLITE_ROW ? sqlite3_column_int64(statement.get(), 0) : 0;
}

bool meansDamage(int code) {
  const int primary = code & 0xff;
  return primary == SQLITE_CORRUPT || primary == SQLITE_NOTADB;
}

// A write without room has a code of its own; making a file or making it durable has not.
bool meansNoRoom(sqlite3* database, int code) {
  const int primary = code & 0xff;
  if (primary == SQLITE_FULL) return true;
  if (primary != SQLITE_CANTOPEN && primary != SQLITE_IOERR) return false;
  const int system = sqlite3_system_errno(database);
  return system == ENOSPC || system == EDQUOT;
}

}  // namespace spacekeep
