// What a failed change of the state leaves to be written later: only what there is.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

TEST(StateFailure, WithoutARecordOfItsOwnTheDaemonPlansNoLaterWrite) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    EXPECT_FALSE(world.set("key", Value("new")));
    rt::sleepNs(2 * kLateWriteDelayNs);
    EXPECT_EQ(world.lines("%s recent statistics are not on the disk: %@"), 0U);
  });
}

TEST(StateFailure, ARecordOfItsOwnIsTriedAgainFiveSecondsLater) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.world.disk().failSynchronize("the disk is full");
    world.setSync(std::make_shared<SpacekeepRecentInfo>(), "record");
    EXPECT_FALSE(world.set("key", Value("new")));
    EXPECT_TRUE(world.eventually(
        [&] { return world.lines("%s recent statistics are not on the disk: %@") > 0; }));
  });
}

}  // namespace
}  // namespace spacekeep::test
