#include "support/preferences/linux/sqlite_suite.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>

#include "support/queues/borrowed_thread.h"
#include "tests/linux/preferences/suite_world.h"

namespace spacekeep {
namespace {

using test::contentOf;
using test::fetch;
using test::fileOf;
using test::kName;
using test::LogCapture;
using test::modeOf;
using test::open;
using test::outside;
using test::store;
using test::TemporaryDirectory;

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
  EXPECT_TRUE(problem->starts_with(fileOf(directory) + " cannot be written: database is locked"))
      << *problem;
  EXPECT_EQ(suite->get("k"), Value(2));
  ASSERT_EQ(execute(holder.get(), "ROLLBACK"), SQLITE_OK);
  EXPECT_EQ(suite->synchronize(), std::nullopt);
  EXPECT_EQ(fetch(directory, "k"), Value(2));
}

TEST(SqliteSuite, AReaderThatKeepsACommitFromEndingIsInNobodysWayOnceItHasLeft) {
  const TemporaryDirectory directory;
  store(directory, "k", 1);
  auto suite = open(directory, {.busy_timeout_ms = 1});
  const Database reader = outside(fileOf(directory));
  ASSERT_EQ(execute(reader.get(), "BEGIN; SELECT * FROM preferences"), SQLITE_OK);
  suite->set("k", 2);
  EXPECT_NE(suite->synchronize(), std::nullopt);
  ASSERT_EQ(execute(reader.get(), "COMMIT"), SQLITE_OK);
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
