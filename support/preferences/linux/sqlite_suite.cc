#include "support/preferences/linux/sqlite_suite.h"

#include <utility>
#include <variant>
#include <vector>

#include "support/logging/log.h"
#include "support/preferences/linux/suite_file.h"
#include "support/queues/concurrent_queue.h"
#include "support/values/plist.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

std::string listOf(const std::set<std::string>& keys) {
  Array array;
  for (const std::string& key : keys) array.push_back(key);
  return textOf(Value(std::move(array)));
}

// A rollback journal that stays (no inode is needed for a commit once it is there), every commit
// through to the disk before it returns, and nothing left to read of what was removed.
int configure(sqlite3* database, const SqliteSuiteOptions& options) {
  sqlite3_busy_timeout(database, options.busy_timeout_ms);
  const std::string sql =
      "PRAGMA journal_mode = PERSIST; PRAGMA synchronous = EXTRA; PRAGMA temp_store = MEMORY;"
      "PRAGMA secure_delete = ON; PRAGMA journal_size_limit = -1;"
      "PRAGMA trusted_schema = OFF; PRAGMA max_page_count = " +
      std::to_string(options.max_pages);
  return execute(database, sql.c_str());
}

std::string columnText(sqlite3_stmt* row, int column) {
  const auto* text = reinterpret_cast<const char*>(sqlite3_column_text(row, column));
  const auto length = static_cast<std::size_t>(sqlite3_column_bytes(row, column));
  return text == nullptr ? std::string() : std::string(text, length);
}

std::span<const std::uint8_t> columnBytes(sqlite3_stmt* row, int column) {
  const auto* bytes = static_cast<const std::uint8_t*>(sqlite3_column_blob(row, column));
  return {bytes, static_cast<std::size_t>(sqlite3_column_bytes(row, column))};
}

void logCannotOpen(const std::string& name, const std::string& reason) {
  logProblem("%s the suite %@ cannot be opened: %@", "openPreferencesSuite", name, reason);
}

}  // namespace

std::unique_ptr<SqliteSuite> SqliteSuite::open(const std::string& directory,
                                               const std::string& name,
                                               SqliteSuiteOptions options) {
  auto opened = openSuiteFile(directory, name);
  if (const auto* error = std::get_if<SuiteFileError>(&opened)) {
    logCannotOpen(name, error->reason);
    return nullptr;
  }
  Database database = std::get<Database>(std::move(opened));
  const int configured = configure(database.get(), options);
  const std::string path = directory + "/" + name + ".sqlite";
  std::unique_ptr<SqliteSuite> suite(
      new SqliteSuite(std::move(database), path, std::move(options)));
  Failure failure = suite->failure(configured);
  if (failure.code == SQLITE_OK) {
    failure = suite->refreshLocked(suite->statements_.changeCounter());
  }
  if (failure.code == SQLITE_OK) {
    suite->prepareFile();
    return suite;
  }
  logCannotOpen(name, failure.reason);
  return nullptr;
}

const Value* SqliteSuite::find(std::string_view key) const {
  if (const auto set = pending_.find(key); set != pending_.end()) {
    return set->second ? &*set->second : nullptr;
  }
  const auto found = stored_.find(key);
  return found == stored_.end() ? nullptr : &found->second;
}

void SqliteSuite::set(std::string_view key, std::optional<Value> value) {
  pending_.insert_or_assign(std::string(key), std::move(value));
}

void SqliteSuite::discard(std::string_view key) {
  if (const auto set = pending_.find(key); set != pending_.end()) pending_.erase(set);
}

std::optional<std::string> SqliteSuite::synchronize() {
  if (pending_.empty()) return refresh();
  // The disk makes this thread wait, so it must not keep others from being served meanwhile.
  const BlockingRegion region;
  std::set<std::string> given_up;
  Failure failure = commitPending(given_up);
  auto wish = SuiteHeadroom::Wish::kIfThereIsRoom;
  if (failure.no_room && options_.make_room()) {
    given_up.clear();
    failure = commitPending(given_up);
    // The room is there now, and others are after it.
    wish = SuiteHeadroom::Wish::kAtAnyCost;
  }
  if (failure.code != SQLITE_OK) {
    return path_ + " cannot be written: " + failure.reason +
           (failure.no_room ? "; space has to be freed on its volume" : "");
  }
  headroom_.growIfLow(wish);
  if (given_up.empty()) return std::nullopt;
  return path_ + ": too deep or too large to be stored and given up: " + listOf(given_up);
}

std::optional<std::string> SqliteSuite::refresh() {
  const auto counter = statements_.changeCounter();
  if (counter && counter == change_counter_) return std::nullopt;
  const BlockingRegion region;
  const Failure failure = refreshLocked(counter);
  if (failure.code == SQLITE_OK) return std::nullopt;
  return path_ + " cannot be read: " + failure.reason;
}

// The counter was read before: what is committed while this looks moves it again and is seen the
// next time.
SqliteSuite::Failure SqliteSuite::refreshLocked(std::optional<std::uint32_t> counter) {
  Failure failure = loadIfChanged();
  change_counter_ = failure.code == SQLITE_OK ? counter : std::nullopt;
  return failure;
}

SqliteSuite::Failure SqliteSuite::failure(int code) const {
  if (code == SQLITE_OK) return {};
  return {code, sqliteText(database_.get(), code), meansNoRoom(database_.get(), code)};
}

// While there is room: a fresh file on a full volume is made by its first commit instead, once room
// was made.
void SqliteSuite::prepareFile() {
  if (!has_table_) {
    int code = statements_.begin();
    if (code == SQLITE_OK) code = statements_.makeTable();
    if (code == SQLITE_OK) code = statements_.commit();
    if (code != SQLITE_OK) return statements_.rollback();
    has_table_ = true;
  }
  headroom_.look();
  headroom_.growIfLow(SuiteHeadroom::Wish::kIfThereIsRoom);
  // Its commits are this connection's own; that is all there is to find.
  static_cast<void>(refreshLocked(statements_.changeCounter()));
}

SqliteSuite::Failure SqliteSuite::commitPending(std::set<std::string>& given_up) {
  Failure what = failure(statements_.begin());
  if (what.code == SQLITE_OK) what = writeAndCommit(given_up);
  if (what.code != SQLITE_OK) {
    statements_.rollback();
    change_counter_.reset();
    return what;
  }
  keepCommitted(given_up);
  return {};
}

// What is on disk is picked up in the same transaction: nothing can come in between, and no second
// look is needed after the commit.
SqliteSuite::Failure SqliteSuite::writeAndCommit(std::set<std::string>& given_up) {
  Failure what = loadIfChanged();
  if (what.code != SQLITE_OK) return what;
  const auto counter = statements_.changeCounter();
  const int pages_before = statements_.pagesWritten();
  int code = writePending(given_up);
  if (code == SQLITE_OK) {
    headroom_.look();
    code = statements_.commit();
  }
  if (code != SQLITE_OK) return failure(code);
  has_table_ = true;
  // Not read from the file: by now it may be the next writer's. A commit that changes nothing writes
  // nothing and leaves the counter alone.
  const bool moved = statements_.pagesWritten() > pages_before;
  change_counter_ = counter ? std::optional(*counter + (moved ? 1 : 0)) : std::nullopt;
  return {};
}

int SqliteSuite::writePending(std::set<std::string>& given_up) {
  int code = has_table_ ? SQLITE_OK : statements_.makeTable();
  for (const auto& [key, value] : pending_) {
    if (code != SQLITE_OK) return code;
    if (!value) {
      code = statements_.remove(key);
      continue;
    }
    const std::vector<std::uint8_t> bytes = binaryPlist(*value);
    if (bytes.empty()) {
      given_up.insert(key);
    } else {
      code = statements_.store(key, bytes);
    }
  }
  return code;
}

void SqliteSuite::keepCommitted(const std::set<std::string>& given_up) {
  for (auto& [key, value] : pending_) {
    if (given_up.contains(key)) continue;
    if (value) {
      stored_.insert_or_assign(key, std::move(*value));
    } else {
      stored_.erase(key);
    }
  }
  pending_.clear();
}

SqliteSuite::Failure SqliteSuite::loadIfChanged() {
  std::int64_t version = 0;
  if (const int code = statements_.dataVersion(version); code != SQLITE_OK) return failure(code);
  if (data_version_ == version) return {};
  Failure result = load();
  if (result.code == SQLITE_OK) data_version_ = version;
  return result;
}

SqliteSuite::Failure SqliteSuite::load() {
  int code = SQLITE_OK;
  const std::int64_t tables = queryInteger(
      database_.get(), "SELECT count(*) FROM sqlite_schema WHERE name = 'preferences'", code);
  if (code != SQLITE_ROW) return failure(code);
  std::map<std::string, Value, std::less<>> loaded;
  if (tables > 0) {
    const Statement rows = prepare(database_.get(), "SELECT key, value FROM preferences");
    code = rows ? sqlite3_step(rows.get()) : sqlite3_extended_errcode(database_.get());
    for (; code == SQLITE_ROW; code = sqlite3_step(rows.get())) loadRow(rows.get(), loaded);
    if (code != SQLITE_DONE) return failure(code);
  }
  has_table_ = tables > 0;
  stored_ = std::move(loaded);
  return {};
}

// A value that cannot be read is left on disk, where a person can look at it, until it is set anew.
void SqliteSuite::loadRow(sqlite3_stmt* row, std::map<std::string, Value, std::less<>>& loaded) {
  const std::string key = columnText(row, 0);
  auto value = parsePlist(columnBytes(row, 1));
  if (const auto* error = std::get_if<PlistError>(&value)) {
    logProblem("%s %@: the value of %@ is left out: %@", "loadSuite", path_, key, error->reason);
    return;
  }
  loaded.insert_or_assign(key, std::get<Value>(std::move(value)));
}

}  // namespace spacekeep
