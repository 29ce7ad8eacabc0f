#include "support/history/linux/sqlite_history.h"

#include <algorithm>
#include <span>
#include <utility>
#include <variant>

#include "support/logging/log.h"
#include "support/preferences/linux/suite_file.h"
#include "support/queues/concurrent_queue.h"
#include "support/values/plist.h"

namespace spacekeep {
namespace {

constexpr const char* kName = "history";
/// "SKHI": this file is no suite.
constexpr SuiteFileKind kKind = {
    .application_id = 0x534b4849,
    .version = 1,
    .what = "the history",
    .table = kName,
    .table_sql =
        "CREATE TABLE history (number INTEGER PRIMARY KEY AUTOINCREMENT, volume TEXT,"
        " entry BLOB NOT NULL)"};

constexpr std::int64_t kPageBytes = 4096;
/// What a row takes besides its content.
constexpr std::int64_t kRowBytes = 64;
/// Of rows up to this size there are several in a page; a larger one may leave most of one empty.
constexpr std::int64_t kSmallRowBytes = 1000;
/// Pages that are not for rows: header, schema, the levels above the rows, and what a change needs
/// for a moment.
constexpr std::int64_t kSparePages = 32;

/// Undoes a transaction that was not brought to its end.
class Transaction {
 public:
  explicit Transaction(sqlite3* database) : database_(database) {}
  ~Transaction() {
    const bool is_open = sqlite3_get_autocommit(database_) == 0;
    if (is_open) static_cast<void>(execute(database_, "ROLLBACK"));
  }
  Transaction(const Transaction&) = delete;
  Transaction& operator=(const Transaction&) = delete;
  [[nodiscard]] int begin() { return execute(database_, "BEGIN IMMEDIATE"); }
  [[nodiscard]] int commit() { return execute(database_, "COMMIT"); }

 private:
  sqlite3* database_;
};

/// Rows do not fill their pages.
std::int64_t fileBytesAtMost(std::size_t content_bytes) {
  const std::int64_t bytes = static_cast<std::int64_t>(content_bytes) + kRowBytes;
  return bytes > kSmallRowBytes ? bytes + kPageBytes : bytes + bytes / 3;
}

int bindText(sqlite3_stmt* statement, int place, const std::string* text) {
  if (text == nullptr) return sqlite3_bind_null(statement, place);
  return sqlite3_bind_text64(statement, place, text->data(), text->size(), SQLITE_STATIC,
                             SQLITE_UTF8);
}

std::optional<Dictionary> entryOf(sqlite3_stmt* row, int column) {
  const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(row, column));
  const auto length = static_cast<std::size_t>(sqlite3_column_bytes(row, column));
  auto parsed = parsePlist(std::span(bytes, length));
  const auto* value = std::get_if<Value>(&parsed);
  const Dictionary* entry = value == nullptr ? nullptr : value->dictionary();
  return entry == nullptr ? std::nullopt : std::optional(*entry);
}

}  // namespace

std::unique_ptr<SqliteHistory> SqliteHistory::open(const std::string& directory,
                                                   SqliteHistoryOptions options) {
  const BlockingRegion region;
  auto history = std::make_unique<SqliteHistory>(Key{}, directory, options);
  const auto problem = history->openFile();
  if (!problem) return history;
  logProblem("%s the history cannot be opened: %@", "openHistory", *problem);
  return nullptr;
}

std::optional<std::string> SqliteHistory::openFile() {
  database_.reset();
  auto opened = openSuiteFile(directory_, kName, kKind);
  if (const auto* error = std::get_if<SuiteFileError>(&opened)) return error->reason;
  database_ = std::get<Database>(std::move(opened));
  const int code = setUp();
  if (code == SQLITE_OK) return std::nullopt;
  std::string problem = problemOf(code);
  database_.reset();
  return problem;
}

// Few pages in memory: the history is read seldom, and each write touches its end alone.
int SqliteHistory::setUp() {
  sqlite3_busy_timeout(database_.get(), options_.busy_timeout_ms);
  const std::string settings =
      "PRAGMA journal_mode = TRUNCATE; PRAGMA synchronous = FULL; PRAGMA temp_store = MEMORY;"
      "PRAGMA cache_size = -128; PRAGMA trusted_schema = OFF; PRAGMA max_page_count = " +
      std::to_string(options_.max_pages);
  int code = execute(database_.get(), settings.c_str());
  if (code != SQLITE_OK) return code;
  const auto version = queryInteger(database_.get(), "PRAGMA user_version", code);
  if (code != SQLITE_ROW) return code;
  return version == kKind.version ? SQLITE_OK : makeTable();
}

int SqliteHistory::makeTable() {
  int code = SQLITE_OK;
  const auto tables = queryInteger(
      database_.get(), "SELECT count(*) FROM sqlite_schema WHERE name = 'history'", code);
  if (code != SQLITE_ROW) return code;
  const std::string sql = "PRAGMA application_id = " + std::to_string(kKind.application_id) + "; " +
                          (tables == 0 ? kKind.table_sql : "") +
                          "; PRAGMA user_version = " + std::to_string(kKind.version);
  return execute(database_.get(), sql.c_str());
}

std::optional<std::string> SqliteHistory::append(const std::vector<Dictionary>& entries) {
  // The disk makes this thread wait, so it must not keep others from being served meanwhile.
  const BlockingRegion region;
  std::vector<Row> rows;
  for (const Dictionary& entry : entries) {
    Bytes bytes = binaryPlist(entry);
    if (!bytes.empty()) rows.push_back({stringAt(entry, "SPACEKEEP_VOLUME"), std::move(bytes)});
  }
  int code = database_ ? transact(rows) : SQLITE_CORRUPT;
  if (meansDamage(code)) {
    if (auto problem = openFile()) return problem;
    code = transact(rows);
  }
  return code == SQLITE_OK ? std::nullopt : std::optional(problemOf(code));
}

int SqliteHistory::transact(const std::vector<Row>& rows) {
  Transaction transaction(database_.get());
  int code = transaction.begin();
  if (code == SQLITE_OK) code = write(rows);
  if (code == SQLITE_OK) code = transaction.commit();
  return code;
}

int SqliteHistory::write(const std::vector<Row>& rows) {
  int code = makeRoom(rows);
  if (code == SQLITE_OK) code = insert(rows);
  if (code != SQLITE_OK) return code;
  const std::string sql =
      "DELETE FROM history WHERE number <= (SELECT max(number) FROM history) - " +
      std::to_string(options_.max_entries);
  return execute(database_.get(), sql.c_str());
}

int SqliteHistory::makeRoom(const std::vector<Row>& rows) {
  std::int64_t row_bytes = 0;
  for (const Row& row : rows) {
    row_bytes += fileBytesAtMost(row.entry.size() + (row.volume ? row.volume->size() : 0));
  }
  const std::int64_t needed_pages = row_bytes / kPageBytes + kSparePages;
  while (true) {
    int code = SQLITE_OK;
    const auto pages = queryInteger(database_.get(), "PRAGMA page_count", code);
    if (code != SQLITE_ROW) return code;
    const auto unused = queryInteger(database_.get(), "PRAGMA freelist_count", code);
    if (code != SQLITE_ROW) return code;
    if (pages - unused + needed_pages <= options_.max_pages) return SQLITE_OK;
    code = dropOldest();
    if (code != SQLITE_OK) return code;
    if (sqlite3_changes(database_.get()) == 0) return SQLITE_OK;
  }
}

int SqliteHistory::dropOldest() {
  return execute(database_.get(),
                 "DELETE FROM history WHERE number IN"
                 " (SELECT number FROM history ORDER BY number LIMIT 32)");
}

int SqliteHistory::insert(const std::vector<Row>& rows) {
  const Statement statement =
      prepare(database_.get(), "INSERT INTO history (volume, entry) VALUES (?1, ?2)");
  if (!statement) return sqlite3_extended_errcode(database_.get());
  for (const Row& row : rows) {
    int code = bindText(statement.get(), 1, row.volume);
    if (code == SQLITE_OK) {
      code = sqlite3_bind_blob64(statement.get(), 2, row.entry.data(), row.entry.size(),
                                 SQLITE_STATIC);
    }
    if (code != SQLITE_OK) return code;
    const int stepped = sqlite3_step(statement.get());
    code = sqlite3_reset(statement.get());
    if (stepped != SQLITE_DONE) return code;
  }
  return SQLITE_OK;
}

std::optional<std::string> SqliteHistory::visit(const HistoryRange& range, const Visitor& visitor) {
  const BlockingRegion region;
  const int code = database_ ? show(range, visitor) : SQLITE_CORRUPT;
  if (code == SQLITE_OK) return std::nullopt;
  std::string problem = database_ ? problemOf(code) : "it is not open";
  if (meansDamage(code)) {
    if (const auto not_opened = openFile()) problem = *not_opened;
  }
  return problem;
}

int SqliteHistory::show(const HistoryRange& range, const Visitor& visitor) {
  const Statement statement =
      prepare(database_.get(),
              "SELECT number, entry FROM history"
              " WHERE number < ?1 AND (?2 IS NULL OR volume = ?2) ORDER BY number DESC");
  if (!statement) return sqlite3_extended_errcode(database_.get());
  const std::uint64_t before = std::min<std::uint64_t>(range.before.value_or(INT64_MAX), INT64_MAX);
  int code = sqlite3_bind_int64(statement.get(), 1, static_cast<sqlite3_int64>(before));
  if (code == SQLITE_OK) {
    code = bindText(statement.get(), 2, range.volume ? &*range.volume : nullptr);
  }
  if (code != SQLITE_OK) return code;
  int stepped = sqlite3_step(statement.get());
  for (; stepped == SQLITE_ROW; stepped = sqlite3_step(statement.get())) {
    auto entry = entryOf(statement.get(), 1);
    if (!entry) continue;
    const auto number = static_cast<std::uint64_t>(sqlite3_column_int64(statement.get(), 0));
    if (!visitor({.number = number, .entry = std::move(*entry)})) return SQLITE_OK;
  }
  return stepped == SQLITE_DONE ? SQLITE_OK : stepped;
}

std::string SqliteHistory::problemOf(int code) const {
  const bool no_room = meansNoRoom(database_.get(), code);
  // In general words: what the database had to say is gone with the transaction.
  return directory_ + "/" + kName + ".sqlite: " + sqliteText(nullptr, code) +
         (no_room ? "; space has to be freed on its volume" : "");
}

}  // namespace spacekeep
