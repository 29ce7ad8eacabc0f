// Late writes that fail: nothing of what they were to write is lost.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr const char* kKey = keys::kRecentServiceStats;
constexpr const char* kNotOnTheDisk = "%s recent statistics are not on the disk: %@";

TEST(LateWriteFailure, ARecordThatDoesNotFitIsRememberedAndWrittenOnceThereIsRoomForIt) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.world.disk().limitValuesTo(2000);
    world.start();
    const Value archive_before = archivedRecentInfo(recordOf("/", "cache", 5));
    EXPECT_TRUE(world.set(kKey, archive_before));
    EXPECT_TRUE(world.set("large", Value(std::string(1000, 'x'))));
    const SpacekeepRecentInfo record = recordOf("/", "cache", std::string(1500, 'y'));
    world.setSync(shared(record), kKey);
    rt::sleepNs(6 * kSecond);
    EXPECT_EQ(world.lines(kNotOnTheDisk), 1U);
    EXPECT_EQ(world.onDisk(kKey), archive_before);
    EXPECT_EQ(world.record(), record);
    EXPECT_EQ(world.get(kKey), Value(archivedRecentInfo(record)));
    // It is in nobody's way.
    EXPECT_TRUE(world.set("small", Value(1)));
    EXPECT_EQ(world.get("small"), Value(1));
    EXPECT_EQ(world.record(), record);
    EXPECT_TRUE(world.set("large", std::nullopt));
    rt::sleepNs(6 * kSecond);
    EXPECT_EQ(world.onDisk(kKey), Value(archivedRecentInfo(record)));
    EXPECT_EQ(world.record(), record);
  });
}

/// Two records, a plain value and the removal of a record, on a disk that takes nothing.
struct LateWorld : StateWorld {
  LateWorld() {
    putOnDisk(Dictionary{{"gone", archivedRecentInfo(recordOf("/", "old", 1))}});
    start();
    world.disk().failSynchronize("the disk is full");
    one = recordOf("/", "cache", 1);
    two = recordOf("/", "cache", 2);
    setSync(shared(one), "one");
    setSync(Value("late"), "plain");
    setSync({}, "gone");
    setSync(shared(two), "two");
  }
  void expectAllToBeSeen() {
    EXPECT_EQ(recordAt("one"), one);
    EXPECT_EQ(recordAt("two"), two);
    EXPECT_EQ(recordAt("gone"), std::nullopt);
    EXPECT_EQ(get("plain"), Value("late"));
  }
  [[nodiscard]] bool areAllOnDisk() const {
    return onDisk("one") == Value(archivedRecentInfo(one)) &&
           onDisk("two") == Value(archivedRecentInfo(two)) && onDisk("plain") == Value("late") &&
           !onDisk("gone").has_value();
  }

  SpacekeepRecentInfo one;
  SpacekeepRecentInfo two;
};

TEST(LateWriteFailure, AClientsSetThatFailsTakesNothingOfItAway) {
  inEverySchedule(kSchedules, [] {
    LateWorld world;
    EXPECT_FALSE(world.set("key", Value("new")));
    EXPECT_FALSE(world.set("plain", Value("new")));
    world.expectAllToBeSeen();
    world.world.disk().failSynchronize("");
    world.expectAllToBeSeen();
    EXPECT_EQ(world.get("key"), std::nullopt);
    rt::sleepNs(6 * kSecond);
    EXPECT_TRUE(world.areAllOnDisk());
    EXPECT_FALSE(world.onDisk("key").has_value());
    world.expectAllToBeSeen();
  });
}

TEST(LateWriteFailure, WhatCouldNotBeWrittenLateNorByAClientIsWrittenAfterTheNextSet) {
  inEverySchedule(kSchedules, [] {
    LateWorld world;
    rt::sleepNs(6 * kSecond);
    EXPECT_EQ(world.lines(kNotOnTheDisk), 1U);
    EXPECT_FALSE(world.set("key", Value("new")));
    rt::sleepNs(6 * kSecond);
    EXPECT_EQ(world.lines(kNotOnTheDisk), 2U);
    world.expectAllToBeSeen();
    world.world.disk().failSynchronize("");
    EXPECT_TRUE(world.set("key", Value(1)));
    rt::sleepNs(6 * kSecond);
    EXPECT_TRUE(world.areAllOnDisk());
    EXPECT_EQ(world.onDisk("key"), Value(1));
    world.expectAllToBeSeen();
  });
}

}  // namespace
}  // namespace spacekeep::test
