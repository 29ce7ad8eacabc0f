#include "support/preferences/linux/sqlite_suite.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include "support/queues/borrowed_thread.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::contentOf;
using test::LogCapture;
using test::TemporaryDirectory;

constexpr const char* kName = "com.quorvel.spacekeep";

std::string fileOf(const TemporaryDirectory& directory) {
  return directory / std::string(kName) + ".sqlite";
}

std::unique_ptr<SqliteSuite> open(const TemporaryDirectory& directory,
                                  SqliteSuiteOptions options = {}) {
  return SqliteSuite::open(directory.path(), kName, std::move(options));
}

// Another program at the file, as an administrator would be.
Database outside(const std::string& path) {
  sqlite3* raw = nullptr;
  EXPECT_EQ(sqlite3_open(path.c_str(), &raw), SQLITE_OK);
  return Database(raw);
}

void store(const TemporaryDirectory& directory, const char* key, const Value& value) {
  auto suite = open(directory);
  ASSERT_NE(suite, nullptr);
  suite->set(key, value);
  ASSERT_EQ(suite->synchronize(), std::nullopt);
}

std::optional<Value> fetch(const TemporaryDirectory& directory, const char* key) {
  auto suite = open(directory);
  return suite == nullptr ? std::nullopt : suite->get(key);
}

mode_t modeOf(const std::string& path) {
  struct stat status {};
  return stat(path.c_str(), &status) == 0 ? status.st_mode & 07777 : 0;
}

std::vector<std::string> setAsideFiles(const TemporaryDirectory& directory) {
  std::vector<std::string> found;
  for (const auto& entry : std::filesystem::directory_iterator(directory.path())) {
    const std::string name = entry.path().filename();
    if (name.starts_with(std::string(kName) + ".corrupt-")) found.push_back(entry.path());
  }
  return found;
}

TEST(SqliteSuite, EveryKindOfValueSurvivesARestart) {
  const TemporaryDirectory directory;
  const Dictionary state{{"text", "x"},
                         {"yes", true},
                         {"big", UINT64_MAX},
                         {"small", INT64_MIN},
                         {"real", 0.5},
                         {"data", Data{{0, 1}}},
                         {"list", Array{1, Array{}}},
                         {"inner", Dictionary{{"k", 1}}}};
  store(directory, "SPACEKEEP_USER_DEFAULTS", state);
  EXPECT_EQ(fetch(directory, "SPACEKEEP_USER_DEFAULTS"), Value(state));
  EXPECT_EQ(fetch(directory, "other"), std::nullopt);
}

TEST(SqliteSuite, SetIsSeenAtOnceAndOnDiskOnlyAfterSynchronize) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  {
    auto suite = open(directory);
    suite->set("k", 2);
    EXPECT_EQ(suite->get("k"), Value(2));
    EXPECT_EQ(fetch(directory, "k"), Value(1));
  }
  EXPECT_EQ(fetch(directory, "k"), Value(1));
}

TEST(SqliteSuite, NoneRemovesTheKey) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory);
  suite->set("k", std::nullopt);
  EXPECT_EQ(suite->get("k"), std::nullopt);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(suite->get("k"), std::nullopt);
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  suite->set("never there", std::nullopt);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
}

TEST(SqliteSuite, KeysOfEveryShapeStayApart) {
  const TemporaryDirectory directory;
  auto suite = open(directory);
  const std::vector<std::string> keys{"",
                                      "a",
                                      "A",
                                      std::string("a\0b", 3),
                                      "\xff",
                                      "'; DROP TABLE preferences; --",
                                      std::string(5000, 'k')};
  for (std::size_t i = 0; i < keys.size(); ++i) suite->set(keys[i], static_cast<int>(i));
  ASSERT_EQ(suite->synchronize(), std::nullopt);
  auto again = open(directory);
  for (std::size_t i = 0; i < keys.size(); ++i)
    EXPECT_EQ(again->get(keys[i]), Value(static_cast<int>(i))) << i;
}

TEST(SqliteSuite, MissingDirectoriesAreMadeAndEverythingIsLockedDown) {
  const TemporaryDirectory directory;
  auto suite = SqliteSuite::open(directory / "a/b", kName);
  ASSERT_NE(suite, nullptr);
  suite->set("k", 1);
  ASSERT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(modeOf(directory / "a"), 0700u);
  EXPECT_EQ(modeOf(directory / "a/b"), 0700u);
  EXPECT_EQ(modeOf(directory / "a/b/" + std::string(kName) + ".sqlite"), 0600u);
  EXPECT_EQ(modeOf(directory / "a/b/" + std::string(kName) + ".sqlite-journal"), 0600u);
}

TEST(SqliteSuite, AFileThatOthersMayReadIsLockedDown) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  ASSERT_EQ(chmod(fileOf(directory).c_str(), 0666), 0);
  EXPECT_EQ(fetch(directory, "k"), Value(1));
  EXPECT_EQ(modeOf(fileOf(directory)), 0600u);
}

TEST(SqliteSuite, TheJournalStaysAfterACommitWithNothingToPlayBack) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  // Its header is cleared, which is the moment that commits.
  const std::string journal = contentOf(fileOf(directory) + "-journal");
  ASSERT_GE(journal.size(), 28u);
  EXPECT_EQ(journal.substr(0, 28), std::string(28, '\0'));
}

TEST(SqliteSuite, WhatAnotherProcessWroteIsPickedUpBySynchronize) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory);
  store(directory, "k", 2);
  store(directory, "new", 3);
  EXPECT_EQ(suite->get("k"), Value(1));
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(suite->get("k"), Value(2));
  EXPECT_EQ(suite->get("new"), Value(3));
  suite->set("mine", 4);
  store(directory, "theirs", 5);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(suite->get("mine"), Value(4));
  EXPECT_EQ(suite->get("theirs"), Value(5));
}

TEST(SqliteSuite, RefreshPicksUpWhatAnotherProcessWroteAndWritesNothingOfItsOwn) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory);
  suite->set("mine", 4);
  store(directory, "k", 2);
  EXPECT_EQ(suite->refresh(), std::nullopt);
  EXPECT_EQ(suite->get("k"), Value(2));
  EXPECT_EQ(suite->get("mine"), Value(4));
  EXPECT_EQ(fetch(directory, "mine"), std::nullopt);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(fetch(directory, "mine"), Value(4));
}

// The counter that says "nothing changed" moves by one with every commit, one's own included.
TEST(SqliteSuite, ForeignCommitsAreSeenHoweverTheyMixWithOwnOnes) {
  const TemporaryDirectory directory;
  auto suite = open(directory);
  auto other = open(directory);
  for (int round = 0; round < 20; ++round) {
    suite->set("mine", round);
    EXPECT_EQ(suite->synchronize(), std::nullopt);
    if (round % 2 == 0) {  // changes nothing, and must not be counted as if it had
      suite->set("mine", round);
      suite->set("never there", std::nullopt);
      EXPECT_EQ(suite->synchronize(), std::nullopt);
    }
    other->set("theirs", round);
    EXPECT_EQ(other->synchronize(), std::nullopt);
    EXPECT_EQ(other->get("mine"), Value(round));
    EXPECT_EQ(suite->refresh(), std::nullopt);
    EXPECT_EQ(suite->get("theirs"), Value(round));
  }
}

TEST(SqliteSuite, AFileTurnedToAWriteAheadLogIsStillFollowed) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory);
  const Database other = outside(fileOf(directory));
  ASSERT_EQ(execute(other.get(), "PRAGMA journal_mode = WAL"), SQLITE_OK);
  for (int round = 0; round < 3; ++round) {
    ASSERT_EQ(execute(other.get(),
                      "UPDATE preferences SET value = CAST('<plist version=\"1.0\">"
                      "<string>w</string></plist>' AS BLOB)"),
              SQLITE_OK);
    EXPECT_EQ(suite->refresh(), std::nullopt);
    EXPECT_EQ(suite->get("k"), Value("w"));
    suite->set("k", round);
    EXPECT_EQ(suite->synchronize(), std::nullopt);
  }
}

TEST(SqliteSuite, RefreshOfAFileThatSomebodyHoldsSaysSo) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory, {.busy_timeout_ms = 1});
  store(directory, "k", 2);
  const Database holder = outside(fileOf(directory));
  ASSERT_EQ(execute(holder.get(), "BEGIN EXCLUSIVE"), SQLITE_OK);
  EXPECT_EQ(suite->refresh(), fileOf(directory) + " cannot be read: database is locked (SQLite 5)");
  EXPECT_EQ(suite->get("k"), Value(1));
  ASSERT_EQ(execute(holder.get(), "ROLLBACK"), SQLITE_OK);
  EXPECT_EQ(suite->refresh(), std::nullopt);
  EXPECT_EQ(suite->get("k"), Value(2));
}

TEST(SqliteSuite, WhatWasDiscardedAfterAFailedCommitNeverComesUpAgain) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory, {.busy_timeout_ms = 1});
  const Database holder = outside(fileOf(directory));
  ASSERT_EQ(execute(holder.get(), "BEGIN EXCLUSIVE"), SQLITE_OK);
  suite->set("k", 2);
  suite->set("other", 3);
  ASSERT_NE(suite->synchronize(), std::nullopt);
  suite->discard("k");
  suite->discard("never set");
  EXPECT_EQ(suite->get("k"), Value(1));
  EXPECT_EQ(suite->get("other"), Value(3));
  ASSERT_EQ(execute(holder.get(), "ROLLBACK"), SQLITE_OK);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(suite->get("k"), Value(1));
  EXPECT_EQ(fetch(directory, "k"), Value(1));
  EXPECT_EQ(fetch(directory, "other"), Value(3));
}

TEST(SqliteSuite, OnlyACommitCountsAsWaiting) {
  const TemporaryDirectory directory;
  auto suite = open(directory);
  std::size_t given_up = 0;
  std::size_t after_reads = 99;
  {
    ConcurrentQueue queue({});
    BorrowedThread thread(queue, [&] { ++given_up; });
    thread.run([&] {
      EXPECT_EQ(suite->refresh(), std::nullopt);
      EXPECT_EQ(suite->synchronize(), std::nullopt);
      after_reads = given_up;
      suite->set("k", 1);
      EXPECT_EQ(suite->synchronize(), std::nullopt);
    });
  }
  EXPECT_EQ(after_reads, 0u);
  EXPECT_EQ(given_up, 1u);
}

TEST(SqliteSuite, AFailedCommitKeepsWhatWasSetAndSaysSo) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory, {.busy_timeout_ms = 1});
  const Database holder = outside(fileOf(directory));
  ASSERT_EQ(execute(holder.get(), "BEGIN EXCLUSIVE"), SQLITE_OK);
  suite->set("k", 2);
  const auto problem = suite->synchronize();
  ASSERT_TRUE(problem);
  EXPECT_TRUE(problem->starts_with(
      fileOf(directory) +
      " cannot be written, what was set is kept for the next try: database is locked"))
      << *problem;
  EXPECT_EQ(suite->get("k"), Value(2));
  ASSERT_EQ(execute(holder.get(), "ROLLBACK"), SQLITE_OK);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(fetch(directory, "k"), Value(2));
}

TEST(SqliteSuite, WithoutRoomTheCommitIsTriedOnceMoreAfterRoomWasMade) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  int asked = 0;
  bool room = false;
  auto suite = open(directory, {.make_room =
                                    [&] {
                                      ++asked;
                                      return room;
                                    },
                                .max_pages = 8});
  suite->set("k", Data{std::vector<std::uint8_t>(600'000, 7)});  // more than the headroom
  suite->set("small", 1);
  const auto problem = suite->synchronize();
  ASSERT_TRUE(problem);
  EXPECT_NE(problem->find("database or disk is full"), std::string::npos) << *problem;
  EXPECT_EQ(asked, 1);
  room = true;
  EXPECT_NE(suite->synchronize(), std::nullopt);  // the promise was not kept: no third try
  EXPECT_EQ(asked, 2);
  EXPECT_EQ(fetch(directory, "k"), Value(1));
  EXPECT_EQ(fetch(directory, "small"), std::nullopt);
  suite->set("k", 3);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(fetch(directory, "k"), Value(3));
  EXPECT_EQ(fetch(directory, "small"), Value(1));
}

TEST(SqliteSuite, AValueThatCannotBeStoredIsGivenUpByNameAndTheOthersAreStored) {
  const TemporaryDirectory directory;
  store(directory, "deep", "old");
  auto suite = open(directory);
  Value deep = 1;
  for (int i = 0; i < 100; ++i) deep = Array{deep};
  suite->set("deep", deep);
  suite->set("good", 1);
  EXPECT_EQ(suite->synchronize(),
            fileOf(directory) + ": too deep or too large to be stored and given up: [\"deep\"]");
  EXPECT_EQ(suite->get("deep"), Value("old"));
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(fetch(directory, "deep"), Value("old"));
  EXPECT_EQ(fetch(directory, "good"), Value(1));
}

TEST(SqliteSuite, AnUnreadableValueIsLeftOutWithAProblemLineAndStaysOnDisk) {
  const TemporaryDirectory directory;
  store(directory, "good", 1);
  ASSERT_EQ(
      execute(outside(fileOf(directory)).get(), "INSERT INTO preferences VALUES ('bad', x'00ff')"),
      SQLITE_OK);
  LogCapture log;
  auto suite = open(directory);
  ASSERT_NE(suite, nullptr);
  EXPECT_EQ(suite->get("bad"), std::nullopt);
  EXPECT_EQ(suite->get("good"), Value(1));
  EXPECT_EQ(log.count(kLogProblem, "the value of bad is left out: not a property list"), 1u);
  int code = 0;
  EXPECT_EQ(
      queryInteger(outside(fileOf(directory)).get(), "SELECT count(*) FROM preferences", code), 2);
}

TEST(SuiteFile, AFileThatIsNoDatabaseIsSetAsideUnchanged) {
  const TemporaryDirectory directory;
  const std::string junk =
      "this is no database, but somebody may want it back" + std::string(5000, '!');
  directory.write(std::string(kName) + ".sqlite", junk);
  // A journal as a finished commit leaves it: the library plays back any other before all else.
  const std::string journal(512, '\0');
  directory.write(std::string(kName) + ".sqlite-journal", journal);
  LogCapture log;
  store(directory, "k", 1);
  EXPECT_EQ(log.count(kLogProblem, "It was set aside as " + directory.path()), 1u);
  const auto aside = setAsideFiles(directory);
  ASSERT_EQ(aside.size(), 2u);
  const std::string main = std::min(aside[0], aside[1]);
  EXPECT_EQ(contentOf(main), junk);
  EXPECT_EQ(contentOf(main + "-journal"), journal);
  EXPECT_EQ(fetch(directory, "k"), Value(1));
}

TEST(SuiteFile, EachDamagedFileIsKeptUnderANameOfItsOwn) {
  const TemporaryDirectory directory;
  for (int round = 0; round < 3; ++round) {
    directory.write(std::string(kName) + ".sqlite",
                    std::string(2000, static_cast<char>('a' + round)));
    EXPECT_NE(open(directory), nullptr);
  }
  EXPECT_EQ(setAsideFiles(directory).size(), 5u);  // the second and the third with their journals
}

TEST(SuiteFile, ADatabaseOfAnotherProgramIsSetAside) {
  const TemporaryDirectory directory;
  ASSERT_EQ(execute(outside(fileOf(directory)).get(),
                    "CREATE TABLE theirs (a); INSERT INTO theirs VALUES (42)"),
            SQLITE_OK);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_TRUE(log.contains(kLogProblem, "it is the database of another program"));
  const auto aside = setAsideFiles(directory);
  ASSERT_EQ(aside.size(), 1u);
  int code = 0;
  EXPECT_EQ(queryInteger(outside(aside[0]).get(), "SELECT a FROM theirs", code), 42);
}

TEST(SuiteFile, ADatabaseDamagedInTheMiddleIsSetAside) {
  const TemporaryDirectory directory;
  store(directory, "k", Data{std::vector<std::uint8_t>(50'000, 1)});
  std::string content = contentOf(fileOf(directory));
  ASSERT_GT(content.size(), 8192u);
  content.replace(4096, 4096, std::string(4096, '\xa5'));
  directory.write(std::string(kName) + ".sqlite", content);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_EQ(setAsideFiles(directory).size(), 2u);  // with its journal
  EXPECT_EQ(log.count(kLogProblem, "It was set aside as"), 1u);
}

TEST(SuiteFile, ATruncatedDatabaseIsSetAside) {
  const TemporaryDirectory directory;
  store(directory, "k", Data{std::vector<std::uint8_t>(50'000, 1)});
  std::filesystem::resize_file(fileOf(directory), 5000);
  LogCapture log;
  EXPECT_EQ(fetch(directory, "k"), std::nullopt);
  EXPECT_EQ(setAsideFiles(directory).size(), 2u);  // with its journal
}

TEST(SuiteFile, AnEmptyFileIsAFreshSuite) {
  const TemporaryDirectory directory;
  directory.write(std::string(kName) + ".sqlite", "");
  LogCapture log;
  store(directory, "k", 1);
  EXPECT_TRUE(log.texts(kLogProblem).empty());
  EXPECT_EQ(fetch(directory, "k"), Value(1));
}

TEST(SuiteFile, AFileOfANewerVersionIsRefusedAndLeftAlone) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  ASSERT_EQ(execute(outside(fileOf(directory)).get(), "PRAGMA user_version = 2"), SQLITE_OK);
  const std::string before = contentOf(fileOf(directory));
  LogCapture log;
  EXPECT_EQ(open(directory), nullptr);
  EXPECT_TRUE(log.contains(kLogProblem, "it was written by a newer version of this program"));
  EXPECT_EQ(contentOf(fileOf(directory)), before);
  EXPECT_TRUE(setAsideFiles(directory).empty());
}

TEST(SuiteFile, WhatIsNoRegularFileIsRefusedAndLeftAlone) {
  LogCapture log;
  const TemporaryDirectory directory;
  std::filesystem::create_directory(fileOf(directory));
  EXPECT_EQ(open(directory), nullptr);
  std::filesystem::remove(fileOf(directory));
  ASSERT_EQ(mkfifo(fileOf(directory).c_str(), 0600), 0);
  EXPECT_EQ(open(directory), nullptr);
  std::filesystem::remove(fileOf(directory));
  directory.write("victim", "untouched");
  std::filesystem::create_symlink("victim", fileOf(directory));
  EXPECT_EQ(open(directory), nullptr);
  EXPECT_EQ(contentOf(directory / "victim"), "untouched");
  EXPECT_EQ(log.count(kLogProblem, "cannot be opened"), 3u);
}

TEST(SuiteFile, UnsafeNamesAndImpossibleDirectoriesAreRefused) {
  LogCapture log;
  const TemporaryDirectory directory;
  for (const std::string& name :
       {std::string(), std::string("../x"), std::string("a/b"), std::string(".hidden"),
        std::string("a\0b", 3), std::string(201, 'n')}) {
    EXPECT_EQ(SqliteSuite::open(directory.path(), name), nullptr) << name;
  }
  EXPECT_EQ(log.count(kLogProblem, "its name is no safe file name"), 6u);
  directory.write("file", "");
  EXPECT_EQ(SqliteSuite::open(directory / "file", kName), nullptr);
  EXPECT_EQ(SqliteSuite::open(directory / "file/below", kName), nullptr);
  EXPECT_EQ(log.count(kLogProblem, "is not a directory"), 2u);
}

// A child commits numbers and tells each one only after synchronize(); it is killed in the middle.
// Whatever moment that hits, the number last told, or the one after it, is what the file holds.
TEST(SqliteSuite, AProcessKilledInTheMiddleLosesNothingItHasConfirmed) {
  const TemporaryDirectory directory;
  int last = 0;
  for (int round = 0; round < 5; ++round) {
    int pipes[2];
    ASSERT_EQ(pipe(pipes), 0);
    const pid_t child = fork();
    if (child == 0) {
      close(pipes[0]);
      auto suite = open(directory);
      for (int number = last + 1; suite != nullptr; ++number) {
        suite->set("number", number);
        if (suite->synchronize() || write(pipes[1], &number, sizeof(number)) != sizeof(number))
          break;
      }
      _exit(1);
    }
    close(pipes[1]);
    for (int told = 0; told < 10 + 7 * round; ++told) {
      ASSERT_EQ(read(pipes[0], &last, sizeof(last)), static_cast<ssize_t>(sizeof(last)));
    }
    ASSERT_EQ(kill(child, SIGKILL), 0);
    ASSERT_EQ(waitpid(child, nullptr, 0), child);
    for (int more = 0; read(pipes[0], &more, sizeof(more)) == sizeof(more);) last = more;
    close(pipes[0]);
    const auto found = fetch(directory, "number");
    ASSERT_TRUE(found);
    const std::int64_t number = found->asSigned().value_or(-1);
    EXPECT_TRUE(number == last || number == last + 1) << number << " after " << last;
    last = static_cast<int>(number);
  }
}

}  // namespace
}  // namespace spacekeep
