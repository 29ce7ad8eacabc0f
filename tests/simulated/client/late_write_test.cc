// When the daemon's own state reaches the disk, to the nanosecond of virtual time.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;

/// The moment of the n-th write since the world began, polled to the nanosecond around `near_ns`.
void expectOneWriteAt(StateWorld& world, std::uint64_t at_ns) {
  const std::uint64_t before = world.world.disk().writes();
  ASSERT_LT(world.world.nowNs(), at_ns);
  rt::sleepNs(at_ns - 1 - world.world.nowNs());
  EXPECT_EQ(world.world.disk().writes(), before);
  rt::sleepNs(2);
  EXPECT_EQ(world.world.disk().writes(), before + 1);
}

TEST(LateWrite, AThousandAnswersMakeOneWriteFiveSecondsAfterTheFirst) {
  inEverySchedule(10, [] {
    StateWorld world;
    world.start();
    const std::uint64_t start_ns = world.world.nowNs();
    SpacekeepRecentInfo record;
    for (int i = 0; i < 1000; ++i) {
      record = recordOf("/", "cache", i);
      world.setSync(shared(record), keys::kRecentServiceStats);
      rt::sleepNs(kSecond / 1000);
    }
    EXPECT_FALSE(world.stateOnDisk().has_value());
    expectOneWriteAt(world, start_ns + 5 * kSecond);
    EXPECT_EQ(world.onDisk(keys::kRecentServiceStats), Value(archivedRecentInfo(record)));
    rt::sleepNs(60 * kSecond);
    EXPECT_EQ(world.world.disk().writes(), 1U);
  });
}

TEST(LateWrite, ASteadyStreamOfAnswersIsWrittenOnceInFiveSeconds) {
  inEverySchedule(10, [] {
    StateWorld world;
    world.start();
    for (int i = 0; i < 210; ++i) {
      world.setSync(shared(recordOf("/", "cache", i)), keys::kRecentServiceStats);
      rt::sleepNs(kSecond / 10);
    }
    EXPECT_EQ(world.world.disk().writes(), 4U);
  });
}

TEST(LateWrite, EachFurtherRoundHasItsOwnFiveSeconds) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    for (const int amount : {1, 2}) {
      const std::uint64_t start_ns = world.world.nowNs();
      world.setSync(shared(recordOf("/", "cache", amount)), keys::kRecentServiceStats);
      expectOneWriteAt(world, start_ns + 5 * kSecond);
      rt::sleepNs(kSecond);
    }
  });
}

TEST(LateWrite, AReadOfItsBytesWritesNothing) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const std::uint64_t start_ns = world.world.nowNs();
    world.setSync(shared(recordOf("/", "cache", 1)), keys::kRecentServiceStats);
    EXPECT_TRUE(world.get(keys::kRecentServiceStats).has_value());
    EXPECT_TRUE(world.get(keys::kUserDefaults).has_value());
    EXPECT_EQ(world.world.disk().writes(), 0U);
    expectOneWriteAt(world, start_ns + 5 * kSecond);
  });
}

TEST(LateWrite, AClientsSetIsOnTheDiskAtOnceWhileTheRecordWaits) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 1)), keys::kRecentServiceStats);
    const std::uint64_t start_ns = world.world.nowNs();
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.world.nowNs(), start_ns);
    EXPECT_EQ(world.onDisk("key"), Value(1));
  });
}

TEST(LateWrite, AnswersThatEndWithTheProcessBeforeFiveSecondsAreNotOnTheDisk) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 1)), keys::kRecentServiceStats);
    rt::sleepNs(4 * kSecond);
    world.world.shutDown();
    EXPECT_FALSE(world.stateOnDisk().has_value());
  });
}

TEST(LateWrite, WhatOthersPutOnTheDiskMeanwhileIsSeenAndKept) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", 5);
    const Value archive = archivedRecentInfo(record);
    world.setSync(shared(record), keys::kRecentServiceStats);
    world.setSync(Value("late"), "plain");
    EXPECT_EQ(world.get(keys::kRecentServiceStats), archive);
    world.putOnDisk(Dictionary{{"theirs", 1}});
    EXPECT_EQ(world.get("theirs"), Value(1));
    const auto state = world.get(keys::kUserDefaults);
    ASSERT_TRUE(state.has_value());
    EXPECT_EQ(*state, Value(Dictionary{{keys::kRecentServiceStats, archive},
                                       {"SPACEKEEP_CACHE_ENABLED", true},
                                       {"plain", "late"},
                                       {"theirs", 1}}));
    EXPECT_TRUE(
        world.eventually([&] { return world.onDisk(keys::kRecentServiceStats) == archive; }));
    EXPECT_EQ(
        world.stateOnDisk(),
        Value(Dictionary{{keys::kRecentServiceStats, archive}, {"plain", "late"}, {"theirs", 1}}));
  });
}

TEST(LateWrite, ThatFailedIsTriedAgainFiveSecondsAfterTheNextChangeAndNotBefore) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    world.setSync(shared(recordOf("/", "cache", 1)), keys::kRecentServiceStats);
    rt::sleepNs(3600 * kSecond);
    EXPECT_EQ(world.lines("%s recent statistics are not on the disk: %@"), 1U);
    world.world.disk().failSynchronize("");
    const std::uint64_t start_ns = world.world.nowNs();
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_FALSE(world.onDisk(keys::kRecentServiceStats).has_value());
    expectOneWriteAt(world, start_ns + 5 * kSecond);
    EXPECT_TRUE(world.onDisk(keys::kRecentServiceStats).has_value());
    rt::sleepNs(3600 * kSecond);
    EXPECT_EQ(world.world.disk().writes(), 2U);
  });
}

TEST(LateWrite, OfAKeyThatAClientHasSetSinceIsNotMade) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 1)), keys::kRecentServiceStats);
    EXPECT_TRUE(world.set(keys::kRecentServiceStats, Value("mine now")));
    rt::sleepNs(60 * kSecond);
    EXPECT_EQ(world.world.disk().writes(), 1U);
    EXPECT_EQ(world.onDisk(keys::kRecentServiceStats), Value("mine now"));
  });
}

}  // namespace
}  // namespace spacekeep::test
