#include "support/preferences/linux/suite_headroom.h"

#include <sys/stat.h>
#include <sys/statvfs.h>

#include <algorithm>
#include <vector>

#include "support/files/linux/atomic_file.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

constexpr std::int64_t kPageBytes = 4096;
/// What of a page on the overflow chain is content.
constexpr std::int64_t kPagePayloadBytes = kPageBytes - 4;
/// A page in the journal, with its number and checksum.
constexpr std::int64_t kJournalPageBytes = kPageBytes + 8;
/// For the journal's header, the table's root and the trunks of the list of unused pages.
constexpr std::int64_t kJournalExtraPages = 16;

// Enough for a state of a few keys to grow to that of many.
constexpr std::int64_t kLeastPages = 64;
/// Grown only where the volume has this many times what is added.
constexpr std::uint64_t kRoomFactor = 8;

}  // namespace

SuiteHeadroom::SuiteHeadroom(sqlite3* database, const std::string& path, std::int64_t max_pages)
    : database_(database),
      directory_(directoryOf(path)),
      journal_path_(path + "-journal"),
      max_pages_(max_pages) {}

void SuiteHeadroom::look() {
  free_pages_ = ask(freelist_count_, "PRAGMA freelist_count");
  used_pages_ = ask(page_count_, "PRAGMA page_count") - free_pages_;
}

void SuiteHeadroom::growIfLow(Wish wish) {
  if (!isLow()) return;
  // What a power cut or a full volume left of an earlier attempt holds the very pages that are
  // missing.
  static_cast<void>(execute(database_, "DELETE FROM spare"));
  look();
  if (!isLow()) return;
  const std::int64_t wanted = wantedPages();
  if (wish == Wish::kIfThereIsRoom && !volumeHasPlenty(wanted)) return;
  // Where not all of it can be had, some of it is better than none.
  int code = fill(wanted);
  if (code == SQLITE_FULL) code = fill((wanted + free_pages_) / 2);
  if (code == SQLITE_FULL) code = fill((wanted + 3 * free_pages_) / 4);
  if (code != SQLITE_OK) {
    logTrace("%s %@: no headroom for now: %@", "growIfLow", journal_path_,
             sqliteText(database_, code));
  }
  static_cast<void>(execute(database_, "DELETE FROM spare"));
  look();
  // The pages that went through the cache are not needed again soon.
  sqlite3_db_release_memory(database_);
}

// A new value is stored before the old one is given up, so there has to be as much again as is in
// use. fill() provides twice that, so that growing is rare.
bool SuiteHeadroom::isLow() const {
  const auto journal_pages = static_cast<std::int64_t>(journalBytes()) / kJournalPageBytes;
  // Near the bound of the file there cannot be more than what is left.
  const std::int64_t possible = wantedPages() - 8;
  return free_pages_ < std::min(kLeastPages / 2 + used_pages_, possible) ||
         journal_pages < std::min(used_pages_ + kJournalExtraPages, possible);
}

std::int64_t SuiteHeadroom::wantedPages() const {
  return std::min(kLeastPages + 2 * used_pages_, max_pages_ - used_pages_ - 2);
}

std::uint64_t SuiteHeadroom::journalBytes() const {
  struct stat status {};
  if (stat(journal_path_.c_str(), &status) != 0) return 0;
  return static_cast<std::uint64_t>(status.st_size);
}

bool SuiteHeadroom::volumeHasPlenty(std::int64_t wanted) const {
  struct statvfs status {};
  if (statvfs(directory_.c_str(), &status) != 0) return false;
  const auto added = static_cast<std::uint64_t>(2 * wanted * kPageBytes);
  return status.f_bavail * status.f_frsize >= added * kRoomFactor;
}

// Pages get into the file when something is stored in them, and into the journal when that is wiped
// again (`secure_delete`). Both are real blocks then, not holes.
int SuiteHeadroom::fill(std::int64_t pages) {
  if (pages <= 0) return SQLITE_OK;
  const int code =
      execute(database_, "CREATE TABLE IF NOT EXISTS spare (id INTEGER PRIMARY KEY, bytes)");
  if (code != SQLITE_OK) return code;
  const std::string sql =
      "INSERT INTO spare VALUES (1, zeroblob(" + std::to_string(pages * kPagePayloadBytes) + "))";
  return execute(database_, sql.c_str());
}

std::int64_t SuiteHeadroom::ask(Statement& statement, const char* sql) {
  if (!statement) statement = prepare(database_, sql);
  if (!statement) return 0;
  const bool row = sqlite3_step(statement.get()) == SQLITE_ROW;
  const std::int64_t answer = row ? sqlite3_column_int64(statement.get(), 0) : 0;
  static_cast<void>(sqlite3_reset(statement.get()));
  return answer;
}

}  // namespace spacekeep
