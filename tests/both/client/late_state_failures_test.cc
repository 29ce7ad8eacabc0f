// What becomes of the daemon's own part of the state when something cannot be written.
#include <gtest/gtest.h>

#include <atomic>
#include <utility>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kKey = keys::kRecentServiceStats;
constexpr const char* kNotOnTheDisk = "%s recent statistics are not on the disk: %@";

TEST(StateFailure, WithoutARecordOfItsOwnTheDaemonPlansNoLaterWrite) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    std::atomic<int> planned{0};
    world.platform.after = [&planned, after = world.platform.after](std::uint64_t delay_ns,
                                                                    auto task) {
      if (delay_ns == kLateWriteDelayNs) ++planned;
      after(delay_ns, std::move(task));
    };
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("key", Value("new")));
    EXPECT_EQ(planned, 0);
    world.setSync(std::make_shared<SpacekeepRecentInfo>(), "record");
    EXPECT_EQ(planned, 1);
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
    EXPECT_EQ(world.get(kKey), std::nullopt);
  });
}

TEST(LateStateFailure, ARecordTooLargeForAnyPropertyListKeepsNoOtherFromTheDisk) {
  inEverySchedule(1, [] {
    StateWorld world;
    world.start();
    const std::string other_key = keys::kRecentServiceStatsAtUrgency + std::string("2");
    const SpacekeepRecentInfo large = recordOf("/", "cache", std::string(kMaxPlistBytes + 1, 'y'));
    const SpacekeepRecentInfo small = recordOf("/", "cache", 5);
    world.setSync(shared(large), other_key);
    world.setSync(shared(small), kKey);
    EXPECT_TRUE(world.eventually([&] { return world.lines(kNotOnTheDisk) > 0; }));
    EXPECT_EQ(world.onDisk(kKey), Value(archivedRecentInfo(small)));
    EXPECT_FALSE(world.onDisk(other_key).has_value());
    EXPECT_EQ(world.recordAt(other_key), large);
    EXPECT_EQ(world.record(), small);
  });
}

TEST(LateStateFailure, AStateThatWasTakenAwayMeanwhileIsNotWritten) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.setSync(shared(recordOf("/", "cache", 5)), kKey);
    world.daemon->defaults_queue()->sync([&] { world.daemon->setUserDefaults(nullptr); });
    rt::sleepNs(2 * kLateWriteDelayNs);
    EXPECT_EQ(world.lines(kNotOnTheDisk), 0U);
    EXPECT_FALSE(world.onDisk(kKey).has_value());
  });
}

}  // namespace
}  // namespace spacekeep::test
