// The history in its file: order, numbers, bounds, and whatever may have become of the file.
#include "support/history/linux/sqlite_history.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/helpers/log_capture.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

namespace fs = std::filesystem;
using test::contentOf;
using test::LogCapture;
using test::TemporaryDirectory;

class History : public testing::Test {
 protected:
  [[nodiscard]] std::string file() const { return directory_ / "history.sqlite"; }
  [[nodiscard]] std::unique_ptr<SqliteHistory> open(SqliteHistoryOptions options = {}) const {
    return SqliteHistory::open(directory_.path(), options);
  }
  [[nodiscard]] std::vector<std::string> setAside() const {
    std::vector<std::string> found;
    for (const auto& entry : fs::directory_iterator(directory_.path())) {
      const std::string name = entry.path().filename();
      if (name.starts_with("history.corrupt-")) found.push_back(entry.path());
    }
    std::ranges::sort(found);
    return found;
  }
  /// Another program at the file, as an administrator would be.
  [[nodiscard]] Database outside() const {
    sqlite3* raw = nullptr;
    EXPECT_EQ(sqlite3_open(file().c_str(), &raw), SQLITE_OK);
    return Database(raw);
  }

  const TemporaryDirectory directory_;
  LogCapture log_;
};

Dictionary entryOf(int number, const std::string& volume = "/", std::size_t padding_bytes = 0) {
  return {{"SPACEKEEP_VOLUME", volume}, {"N", number}, {"P", std::string(padding_bytes, 'p')}};
}

void append(SqliteHistory& history, int first, int last, const std::string& volume = "/",
            std::size_t padding_bytes = 0) {
  std::vector<Dictionary> entries;
  for (int i = first; i <= last; ++i) entries.push_back(entryOf(i, volume, padding_bytes));
  ASSERT_EQ(history.append(entries), std::nullopt);
}

std::vector<StoredEntry> all(HistoryStore& history, const HistoryRange& range = {}) {
  std::vector<StoredEntry> entries;
  EXPECT_EQ(history.visit(range,
                          [&](StoredEntry entry) {
                            entries.push_back(std::move(entry));
                            return true;
                          }),
            std::nullopt);
  return entries;
}

std::vector<std::uint64_t> numbersOf(const std::vector<StoredEntry>& entries) {
  std::vector<std::uint64_t> numbers;
  for (const StoredEntry& entry : entries) numbers.push_back(entry.number);
  return numbers;
}

Dictionary newest(HistoryStore& history) {
  Dictionary entry;
  EXPECT_EQ(history.visit({},
                          [&](StoredEntry stored) {
                            entry = std::move(stored.entry);
                            return false;
                          }),
            std::nullopt);
  return entry;
}

using Numbers = std::vector<std::uint64_t>;

TEST_F(History, ShowsTheNewestFirstWithEverythingInThem) {
  const auto history = open();
  append(*history, 11, 13);
  const auto entries = all(*history);
  EXPECT_EQ(numbersOf(entries), (Numbers{3, 2, 1}));
  EXPECT_EQ(entries.front().entry, entryOf(13));
}

TEST_F(History, IsThereAfterARestartAndCountsOn) {
  append(*open(), 1, 2);
  const auto history = open();
  append(*history, 3, 3);
  EXPECT_EQ(numbersOf(all(*history)), (Numbers{3, 2, 1}));
}

TEST_F(History, ShowsTheEntriesBeforeANumberAndOfOneVolume) {
  const auto history = open();
  append(*history, 1, 2, "/");
  append(*history, 3, 4, "/data");
  append(*history, 5, 6, "/");
  EXPECT_EQ(numbersOf(all(*history, {.before = 4})), (Numbers{3, 2, 1}));
  EXPECT_EQ(numbersOf(all(*history, {.volume = "/data"})), (Numbers{4, 3}));
  EXPECT_EQ(numbersOf(all(*history, {.before = 4, .volume = "/data"})), (Numbers{3}));
  EXPECT_EQ(numbersOf(all(*history, {.before = 1})), Numbers{});
  EXPECT_EQ(numbersOf(all(*history, {.before = UINT64_MAX})).size(), 6U);
  EXPECT_EQ(numbersOf(all(*history, {.volume = ""})), Numbers{});
}

TEST_F(History, StopsWhenTheReaderHasEnough) {
  const auto history = open();
  append(*history, 1, 5);
  int seen = 0;
  EXPECT_EQ(history->visit({}, [&](const StoredEntry&) { return ++seen < 2; }), std::nullopt);
  EXPECT_EQ(seen, 2);
}

TEST_F(History, EntriesWithoutAVolumeAreKeptToo) {
  const auto history = open();
  ASSERT_EQ(history->append({Dictionary{{"N", 1}}}), std::nullopt);
  EXPECT_EQ(all(*history).size(), 1U);
}

TEST_F(History, KeepsNoMoreThanSoManyEntries) {
  const auto history = open({.max_entries = 100});
  for (int i = 0; i < 10; ++i) append(*history, 30 * i + 1, 30 * i + 30);
  const auto numbers = numbersOf(all(*history));
  ASSERT_EQ(numbers.size(), 100U);
  EXPECT_EQ(numbers.front(), 300U);
  EXPECT_EQ(numbers.back(), 201U);
}

TEST_F(History, KeepsTenThousandUnlessToldOtherwise) {
  const auto history = open();
  for (int i = 0; i < 11; ++i) append(*history, 1, 1000);
  EXPECT_EQ(all(*history).size(), 10'000U);
  EXPECT_LE(fs::file_size(file()), 8U << 20U);
}

TEST_F(History, LetsTheOldestGoBeforeItsFileGetsTooLarge) {
  const auto history = open();
  int last = 0;
  for (const std::size_t padding_bytes : {22'000U, 2'100U, 300U, 8'000U, 22'000U}) {
    for (int i = 0; i < 5; ++i, last += 200) {
      append(*history, last + 1, last + 200, "/", padding_bytes);
      ASSERT_LE(fs::file_size(file()), 8U << 20U);
      ASSERT_EQ(newest(*history).find("N")->asSigned(), last + 200);
    }
  }
  const auto numbers = numbersOf(all(*history));
  EXPECT_GT(numbers.size(), 200U) << "no more is thrown away than is needed";
  EXPECT_EQ(numbers.front(), static_cast<std::uint64_t>(last));
}

TEST(HistoryBounds, AreTenThousandEntriesAndEightMebibytes) {
  EXPECT_EQ(SqliteHistoryOptions().max_entries, 10'000);
  EXPECT_EQ(SqliteHistoryOptions().max_pages * 4096, 8 << 20);
}

TEST_F(History, NumbersGoOnEvenWhenAllOldEntriesHadToGo) {
  const auto history = open({.max_pages = 128});
  append(*history, 1, 60, "/", 3000);
  append(*history, 61, 110, "/", 3000);
  const auto numbers = numbersOf(all(*history));
  EXPECT_EQ(numbers.front(), 110U);
  EXPECT_LT(numbers.size(), 110U);
}

TEST_F(History, IsForItsOwnerAlone) {
  append(*open(), 1, 1);
  struct stat status {};
  ASSERT_EQ(stat(file().c_str(), &status), 0);
  EXPECT_EQ(status.st_mode & 07777U, 0600U);
}

TEST_F(History, AFileThatIsNoDatabaseIsSetAsideByteForByteAndTheHistoryBegunAnew) {
  const std::string junk = "no database, but somebody may want it back" + std::string(5000, '!');
  directory_.write("history.sqlite", junk);
  const auto history = open();
  ASSERT_NE(history, nullptr);
  append(*history, 1, 1);
  EXPECT_EQ(all(*history).size(), 1U);
  ASSERT_EQ(setAside().size(), 1U);
  EXPECT_EQ(contentOf(setAside().front()), junk);
  EXPECT_EQ(log_.count(kLogProblem, "It was set aside as " + setAside().front() +
                                        " and the history starts empty."),
            1U);
}

TEST_F(History, ASuiteInItsPlaceIsTheDatabaseOfAnotherProgram) {
  ASSERT_EQ(
      execute(outside().get(), "PRAGMA application_id = 1397444678; CREATE TABLE preferences (a)"),
      SQLITE_OK);
  EXPECT_NE(open(), nullptr);
  EXPECT_TRUE(log_.contains(kLogProblem, "it is the database of another program"));
  EXPECT_EQ(setAside().size(), 1U);
}

TEST_F(History, ATableWithoutItsKeyIsSetAsideBecauseItWouldLoseWhatIsWritten) {
  append(*open(), 1, 3);
  std::string content = contentOf(file());
  const std::size_t at = content.find("PRIMARY KEY AUTOINCREMENT");
  ASSERT_NE(at, std::string::npos);
  content.replace(at, 25, 25, 'x');  // a type of three words instead, for all that SQLite knows
  directory_.write("history.sqlite", content);
  const auto history = open();
  ASSERT_NE(history, nullptr);
  append(*history, 4, 5);
  EXPECT_EQ(all(*history).size(), 2U);
  EXPECT_TRUE(log_.contains(kLogProblem, "its table is not as this program makes it"));
  const auto aside = setAside();  // the file and its empty journal
  EXPECT_TRUE(std::ranges::any_of(
      aside, [&content](const std::string& path) { return contentOf(path) == content; }));
}

TEST_F(History, AFileWithoutItsTableIsSetAside) {
  append(*open(), 1, 3);
  ASSERT_EQ(execute(outside().get(), "DROP TABLE history"), SQLITE_OK);
  const auto history = open();
  ASSERT_NE(history, nullptr);
  append(*history, 4, 5);
  EXPECT_EQ(all(*history).size(), 2U);
  EXPECT_EQ(setAside().size(), 1U);
}

TEST_F(History, OfANewerVersionIsLeftAloneAndNotOpened) {
  append(*open(), 1, 1);
  ASSERT_EQ(execute(outside().get(), "PRAGMA user_version = 2"), SQLITE_OK);
  const std::string content = contentOf(file());
  EXPECT_EQ(open(), nullptr);
  EXPECT_EQ(contentOf(file()), content);
  EXPECT_EQ(log_.count(kLogProblem, "openHistory the history cannot be opened: " + file() +
                                        ": it was written by a newer version of this program"),
            1U);
}

TEST_F(History, DamageThatShowsUpWhileItIsOpenIsSetAsideAndTheEntriesGoIntoANewFile) {
  const auto history = open();
  append(*history, 1, 200, "/", 2000);
  std::string content = contentOf(file());
  std::fill(content.begin() + 4096, content.end(), '\xa5');
  content[27] = '\x7f';  // the change counter: what is in memory no longer counts
  directory_.write("history.sqlite", content);
  append(*history, 201, 202);
  EXPECT_EQ(all(*history).size(), 2U);
  ASSERT_FALSE(setAside().empty());
  EXPECT_EQ(contentOf(setAside().front()), content);
}

TEST_F(History, DamageThatShowsUpInReadingIsToldAndTheNextReaderFindsANewFile) {
  const auto history = open();
  append(*history, 1, 200, "/", 2000);
  std::string content = contentOf(file());
  std::fill(content.begin() + 4096, content.end(), '\xa5');
  content[27] = '\x7f';  // the change counter: what is in memory no longer counts
  directory_.write("history.sqlite", content);
  const auto problem = history->visit({}, [](const StoredEntry&) { return true; });
  ASSERT_TRUE(problem.has_value());
  EXPECT_NE(problem->find("malformed"), std::string::npos) << *problem;
  EXPECT_TRUE(all(*history).empty());
}

TEST_F(History, AnEntryThatIsNoneIsPassedOver) {
  const auto history = open();
  append(*history, 1, 2);
  ASSERT_EQ(execute(outside().get(), "UPDATE history SET entry = x'00' WHERE number = 1"),
            SQLITE_OK);
  EXPECT_EQ(numbersOf(all(*history)), (Numbers{2}));
}

TEST_F(History, HeldByAnotherProgramIsAProblemInWordsAndLosesNothing) {
  const auto history = open({.busy_timeout_ms = 1});
  append(*history, 1, 1);
  const Database other = outside();
  ASSERT_EQ(execute(other.get(), "BEGIN EXCLUSIVE"), SQLITE_OK);
  const auto problem = history->append({entryOf(2)});
  ASSERT_TRUE(problem.has_value());
  EXPECT_NE(problem->find("database is locked"), std::string::npos) << *problem;
  ASSERT_EQ(execute(other.get(), "COMMIT"), SQLITE_OK);
  append(*history, 2, 2);
  EXPECT_EQ(numbersOf(all(*history)), (Numbers{2, 1}));
}

TEST_F(History, ADirectoryThatIsNoneIsAProblemInWords) {
  directory_.write("state", "a file");
  EXPECT_EQ(SqliteHistory::open(directory_ / "state"), nullptr);
  EXPECT_EQ(log_.count(kLogProblem, "openHistory the history cannot be opened: "), 1U);
}

}  // namespace
}  // namespace spacekeep
