// The file of the history: opened over any bytes, or over a sound file, with a journal or a log
// beside it or without, that was damaged here and there. What is damaged is set aside as it was, what
// is shown is in order and can be sent, and what a sound file then takes it shows.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "fuzz/helpers/database_files.h"
#include "fuzz/helpers/promises.h"
#include "history/page.h"
#include "support/history/linux/sqlite_history.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep::fuzz {
namespace {

constexpr const char* kName = "history";
constexpr std::uint64_t kOldEntries = 3;
// Small files are opened and written sooner.
const SqliteHistoryOptions kOptions{.max_entries = 16, .max_pages = 64};

Dictionary entryOf(std::uint64_t number) {
  return {{"SPACEKEEP_VOLUME", number % 2 == 0 ? "/data" : "/"}, {"NUMBER", number}};
}

const DatabaseTemplates& templates() {
  static const DatabaseTemplates all = makeTemplates(
      {.name = kName,
       .make =
           [](const std::string& directory) {
             const auto history = SqliteHistory::open(directory, kOptions);
             require(history != nullptr, "a history can be made");
             std::vector<Dictionary> entries;
             for (std::uint64_t number = 1; number <= kOldEntries; ++number) {
               entries.push_back(entryOf(number));
             }
             require(!history->append(entries), "a history can be written");
           },
       .interrupted = "PRAGMA journal_mode = PERSIST; BEGIN; UPDATE history SET entry = x'00';"
                      "CREATE TABLE other (a)",
       .logged = "PRAGMA journal_mode = WAL;"
                 " INSERT INTO history (volume, entry) SELECT volume, entry FROM history"});
  return all;
}

/// Everything that is shown of `range`, newest first; false when it cannot be read.
bool read(SqliteHistory& history, const HistoryRange& range, std::vector<StoredEntry>& entries) {
  const auto problem = history.visit(range, [&](StoredEntry entry) {
    require(entries.empty() || entry.number < entries.back().number, "numbers only fall");
    require(!range.before || entry.number < *range.before, "only what was asked for is shown");
    entries.push_back(std::move(entry));
    return true;
  });
  require(!problem || isOneLine(*problem), "a refusal is one line");
  return !problem;
}

void requirePages(const std::vector<StoredEntry>& entries) {
  history::Page page(history::kDefaultPageEntries);
  for (const StoredEntry& entry : entries) {
    if (!page.take(entry)) break;
  }
  const Dictionary answer = std::move(page).answer();
  require(requireStableRoundTrip(Value(answer)) || !entries.empty(), "an answer can be written");
}

bool takesAndShows(SqliteHistory& history) {
  if (history.append({entryOf(99)})) return false;
  std::vector<StoredEntry> entries;
  if (!read(history, {}, entries)) return false;
  require(!entries.empty() && isSame(Value(entries[0].entry), Value(entryOf(99))),
          "what was written comes first");
  require(entries.size() <= static_cast<std::size_t>(kOptions.max_entries),
          "older entries went to make room");
  return true;
}

/// Of a template as it was made.
void requireUndamaged(SqliteHistory* history, std::uint8_t start) {
  require(history != nullptr, "a sound file can be opened");
  std::vector<StoredEntry> entries;
  require(read(*history, {}, entries), "a sound file can be read");
  require(entries.size() == (start == 3 ? 2 * kOldEntries : kOldEntries),
          "what was begun is taken back, what was written ahead is there");
  require(isSame(Value(entries.back().entry), Value(entryOf(1))), "the first entry is the last");
  require(takesAndShows(*history), "a sound file takes entries");
}

void examine(std::string_view input) {
  const DatabaseFiles files = filesOf(input, templates());
  const test::TemporaryDirectory directory;
  const std::string path = layOut(directory.path(), kName, files);
  const auto history = SqliteHistory::open(directory.path(), kOptions);
  const std::string aside = setAside(directory.path(), kName);
  requireNothingLost(files, path, aside, history != nullptr);
  const auto start = static_cast<std::uint8_t>(input.size() == 1 ? input[0] & 3 : 0);
  if (start != 0) return requireUndamaged(history.get(), start);
  if (history == nullptr) return;
  std::vector<StoredEntry> entries;
  require(read(*history, {}, entries) || aside.empty(), "a fresh history can be read");
  requirePages(entries);
  std::vector<StoredEntry> fewer;
  read(*history, {.before = 3, .volume = "/"}, fewer);
  require(takesAndShows(*history) || aside.empty(), "a fresh history takes entries");
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  spacekeep::fuzz::checkLogLines();
  spacekeep::fuzz::learnFromLogLines();
  return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  spacekeep::fuzz::examine(spacekeep::fuzz::textOfInput(data, size));
  return 0;
}
