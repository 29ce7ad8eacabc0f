// What becomes of the daemon's own part of the state when something cannot be written.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kKey = keys::kRecentServiceStats;
constexpr const char* kNotOnTheDisk = "%s recent statistics are not on the disk: %@";

TEST(StateFailure, WithoutARecordOfItsOwnTheDaemonPlansNoLaterWrite) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("key", Value("new")));
    rt::sleepNs(2 * kLateWriteDelayNs);
    EXPECT_EQ(world.lines(kNotOnTheDisk), 0U);
  });
}

TEST(StateFailure, ARecordOfItsOwnIsTriedAgainFiveSecondsLater) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    world.setSync(std::make_shared<SpacekeepRecentInfo>(), "record");
    EXPECT_FALSE(world.set("key", Value("new")));
    EXPECT_TRUE(world.eventually([&] { return world.lines(kNotOnTheDisk) > 0; }));
  });
}

TEST(LateStateFailure, ASmallSetOfAClientIsStoredWhileARecordWaitsThatDoesNotFit) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.world.disk().limitValuesTo(2000);
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", std::string(3000, 'y'));
    world.setSync(shared(record), kKey);
    // Bytes that somebody wanted are no reason to write them.
    EXPECT_EQ(world.get(kKey), Value(archivedRecentInfo(record)));
    EXPECT_TRUE(world.set("small", Value(1)));
    EXPECT_EQ(world.onDisk("small"), Value(1));
    EXPECT_EQ(world.record(), record);
  });
}

TEST(LateStateFailure, ARecordTooLargeForAnyPropertyListIsRemembered) {
  inEverySchedule(1, [] {
    StateWorld world;
    world.start();
    const SpacekeepRecentInfo record = recordOf("/", "cache", std::string(kMaxPlistBytes + 1, 'y'));
    world.setSync(shared(record), kKey);
    const std::string line =
        "writeNow recent statistics are not on the disk: a record is too large for a property list";
    EXPECT_TRUE(world.eventually([&] { return world.world.trace().hasLine(line); }));
    EXPECT_EQ(world.record(), record);
    EXPECT_FALSE(world.onDisk(kKey).has_value());
  });
}

}  // namespace
}  // namespace spacekeep::test
