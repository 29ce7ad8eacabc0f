#include "support/preferences/linux/suite_statements.h"

#include <array>

#include "support/preferences/linux/suite_file.h"

namespace spacekeep {
namespace {

// From the description of the file's header (SQLite, "Database File Format").
constexpr sqlite3_int64 kWriteVersionOffset = 18;
constexpr std::size_t kChangeCounterOffset = 24 - kWriteVersionOffset;
constexpr std::uint8_t kWriteAheadLog = 2;

int bindText(sqlite3_stmt* statement, int place, const std::string& text) {
  return sqlite3_bind_text64(statement, place, text.data(), text.size(), SQLITE_STATIC,
                             SQLITE_UTF8);
}

// Forgets what was bound, which is only good during the call.
int runToEnd(sqlite3_stmt* statement) {
  const int stepped = sqlite3_step(statement);
  const int reset = sqlite3_reset(statement);
  static_cast<void>(sqlite3_clear_bindings(statement));
  return stepped == SQLITE_DONE || stepped == SQLITE_ROW ? SQLITE_OK : reset;
}

}  // namespace

bool SuiteStatements::have(Statement& statement, const char* sql) {
  if (!statement) statement = prepare(database_, sql);
  return statement != nullptr;
}

int SuiteStatements::preparationError() const { return sqlite3_extended_errcode(database_); }

int SuiteStatements::run(Statement& statement, const char* sql) {
  return have(statement, sql) ? runToEnd(statement.get()) : preparationError();
}

int SuiteStatements::makeTable() {
  static const std::string sql = "PRAGMA application_id = " + std::to_string(kSuiteApplicationId) +
                                 "; PRAGMA user_version = " + std::to_string(kSuiteVersion) + "; " +
                                 kSuiteTableSql;
  return execute(database_, sql.c_str());
}

int SuiteStatements::store(const std::string& key, std::span<const std::uint8_t> bytes) {
  if (!have(store_, "INSERT OR REPLACE INTO preferences (key, value) VALUES (?1, ?2)")) {
    return preparationError();
  }
  int code = bindText(store_.get(), 1, key);
  if (code == SQLITE_OK) {
    code = sqlite3_bind_blob64(store_.get(), 2, bytes.data(), bytes.size(), SQLITE_STATIC);
  }
  return code == SQLITE_OK ? runToEnd(store_.get()) : code;
}

int SuiteStatements::remove(const std::string& key) {
  if (!have(remove_, "DELETE FROM preferences WHERE key = ?1")) return preparationError();
  const int code = bindText(remove_.get(), 1, key);
  return code == SQLITE_OK ? runToEnd(remove_.get()) : code;
}

int SuiteStatements::dataVersion(std::int64_t& version) {
  if (!have(data_version_, "PRAGMA data_version")) return preparationError();
  const int code = sqlite3_step(data_version_.get());
  if (code == SQLITE_ROW) version = sqlite3_column_int64(data_version_.get(), 0);
  const int reset = sqlite3_reset(data_version_.get());
  return code == SQLITE_ROW ? SQLITE_OK : reset;
}

std::optional<std::uint32_t> SuiteStatements::changeCounter() const {
  sqlite3_file* file = nullptr;
  std::array<std::uint8_t, 10> header{};
  if (sqlite3_file_control(database_, "main", SQLITE_FCNTL_FILE_POINTER, &file) != SQLITE_OK ||
      file == nullptr || file->pMethods == nullptr) {
    return std::nullopt;
  }
  const int code = file->pMethods->xRead(file, header.data(), static_cast<int>(header.size()),
                                         kWriteVersionOffset);
  // What a fresh file does not have yet reads as zero.
  const bool read = code == SQLITE_OK || code == SQLITE_IOERR_SHORT_READ;
  if (!read || header[0] == kWriteAheadLog) return std::nullopt;
  std::uint32_t counter = 0;
  for (std::size_t i = 0; i < 4; ++i) counter = counter << 8 | header[kChangeCounterOffset + i];
  return counter;
}

int SuiteStatements::pagesWritten() const {
  int pages = 0;
  int unused = 0;
  static_cast<void>(sqlite3_db_status(database_, SQLITE_DBSTATUS_CACHE_WRITE, &pages, &unused, 0));
  return pages;
}

}  // namespace spacekeep
