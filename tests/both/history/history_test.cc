// The history on its queue: what is added is seen at once and written late, and a disk that refuses
// costs entries and nothing else.
#include "history/history.h"

#include <gtest/gtest.h>

#include "tests/both/history/history_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

std::vector<std::int64_t> numbersOf(const std::vector<Dictionary>& entries) {
  std::vector<std::int64_t> numbers;
  for (const Dictionary& entry : entries) {
    numbers.push_back(entry.find("N")->asSigned().value_or(-1));
  }
  return numbers;
}

TEST(History, IsNoneWhereThePlatformKeepsNone) {
  sim::World world;
  EXPECT_EQ(History::create(world.platform()), nullptr);
}

TEST(History, ShowsWhatWasAddedBeforeThePageWasAskedFor) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    for (int i = 1; i <= 3; ++i) history->add(numbered(i));
    const auto entries = world.page(*history).entries();
    EXPECT_EQ(numbersOf(entries), (std::vector<std::int64_t>{3, 2, 1}));
    EXPECT_EQ(*entries.front().find(keys::kEntry), Value(3));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(History, PagesGoOnWhereTheLastOneEnded) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    for (int i = 1; i <= 5; ++i) history->add(numbered(i));
    const auto first = world.page(*history, {{keys::kLimit, 2}});
    EXPECT_EQ(numbersOf(first.entries()), (std::vector<std::int64_t>{5, 4}));
    ASSERT_TRUE(first.page->contains(keys::kNext));
    const auto rest = world.page(*history, {{keys::kBefore, *first.page->find(keys::kNext)}});
    EXPECT_EQ(numbersOf(rest.entries()), (std::vector<std::int64_t>{3, 2, 1}));
    EXPECT_FALSE(rest.page->contains(keys::kNext));
  });
}

TEST(History, EntriesOfManyThreadsAllArrive) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    for (int i = 0; i < 40; ++i) {
      world.world.global().async([history, i] { history->add(numbered(i)); });
    }
    EXPECT_TRUE(world.eventually([&] { return world.world.history().entries().size() == 40; }));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(History, GivesUpTheOldestWhenTooManyWaitAndSaysHowMany) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    for (int i = 0; i < 300; ++i) history->add(numbered(i));
    EXPECT_TRUE(world.eventually([&] { return !world.world.history().entries().empty(); }));
    const auto stored = world.world.history().entries();
    ASSERT_EQ(stored.size(), History::kMaxWaiting);
    EXPECT_EQ(stored.front().entry, numbered(44));
    EXPECT_EQ(stored.back().entry, numbered(299));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{"writeHistory 44 entries of the history were given up, more "
                                       "than 256 wait for the disk"});
  });
}

TEST(History, ThatCannotBeWrittenWaitsAndIsWrittenWhenTheDiskIsBack) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().fail("the disk is full");
    history->add(numbered(1));
    EXPECT_TRUE(world.eventually([&] { return !world.problems().empty(); }));
    EXPECT_EQ(world.problems().front(),
              "writeHistory The history is not on the disk and is tried again in 10 s: the disk is "
              "full");
    history->add(numbered(2));
    world.world.history().fail("");
    EXPECT_TRUE(world.eventually([&] { return world.world.history().entries().size() == 2; }));
    EXPECT_EQ(world.world.history().entries().front().entry, numbered(1));
  });
}

TEST(History, ThatCannotBeOpenedIsToldToTheReaderAndOpenedLater) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().refuseToOpen(true);
    history->add(numbered(1));
    EXPECT_EQ(world.page(*history).failure, "it cannot be opened");
    world.world.history().refuseToOpen(false);
    EXPECT_EQ(numbersOf(world.page(*history).entries()), (std::vector<std::int64_t>{1}));
  });
}

TEST(History, ThatCannotBeReadTellsWhy) {
  inEverySchedule(kSchedules, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().fail("the disk is gone");
    EXPECT_EQ(world.page(*history).failure, "the disk is gone");
    EXPECT_TRUE(world.problems().empty()) << "readers do not fill the log";
  });
}

TEST(History, KeepsNoMoreThanItsBoundWhileTheDiskRefuses) {
  inEverySchedule(4, [] {
    HistoryWorld world;
    const auto history = History::create(world.world.platform());
    world.world.history().fail("the disk is full");
    for (int i = 0; i < 200; ++i) history->add(numbered(i));
    EXPECT_TRUE(world.eventually([&] { return world.world.history().writes() == 1; }));
    for (int i = 200; i < 400; ++i) history->add(numbered(i));
    world.world.history().fail("");
    EXPECT_EQ(world.page(*history, {{keys::kLimit, 1000}}).entries().size(), History::kMaxWaiting);
    EXPECT_EQ(world.world.history().entries().front().entry, numbered(144));
  });
}

}  // namespace
}  // namespace spacekeep::test
