// "SPACEKEEP_FINISH_EARLY", and that nothing changes without it.
#include <gtest/gtest.h>

#include "tests/both/purge/purge_world.h"
#include "tests/helpers/schedules.h"
#include "tests/simulated/purge/acting_statistics.h"

namespace spacekeep::test {
namespace {

std::uint64_t durationOf(PurgeWorld& world, Dictionary request) {
  const std::uint64_t start_ns = world.world.nowNs();
  world.purge(std::move(request));
  return world.world.nowNs() - start_ns;
}

TEST(FinishEarly, ARequestForNothingEndsAtOnceWithoutAnyUrgency) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("cache", sim::ownsBytes("/", 100));
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 0}, {keys::kFinishEarly, true}}), 0U);
    EXPECT_FALSE(world.answers().back().contains("SPACEKEEP_URGENCY_1_OPERATION_INFO"));
    EXPECT_FALSE(world.answers().back().contains(keys::kOperationCancelled));
  });
}

TEST(FinishEarly, FalseOrAbsentWaitsAsLongAsEver) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld with_false;
    EXPECT_EQ(durationOf(with_false, {{keys::kAmount, 0}, {keys::kFinishEarly, false}}),
              12 * kSecond);
  });
  inEverySchedule(kSchedules, [] {
    PurgeWorld absent;
    EXPECT_EQ(durationOf(absent, {{keys::kAmount, 0}}), 12 * kSecond);
  });
}

TEST(FinishEarly, EndsWhenTheLastOfManyAnswersIsBooked) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    for (int i = 0; i < 20; ++i) {
      world.add("service " + std::to_string(i),
                ownsAndAnswersAfter(1000, static_cast<std::uint64_t>(100 + i) * kMs));
    }
    // Those that are offered a second share answer it after as long again.
    EXPECT_LE(durationOf(world, {{keys::kAmount, 2000}, {keys::kFinishEarly, true}}), 238 * kMs);
    const Dictionary outcome = world.answers().back();
    EXPECT_GE(unsignedAt(outcome, keys::kAmount), 2000U);
    EXPECT_TRUE(outcome.contains("SPACEKEEP_URGENCY_1_OPERATION_INFO"));
    EXPECT_FALSE(outcome.contains("SPACEKEEP_URGENCY_2_OPERATION_INFO"));
  });
}

TEST(FinishEarly, WaitsForAServiceThatIsStillAtWork) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour generous = sim::ownsBytes("/", 1000);
    generous.purge = {sim::CallBehaviour{.delay_ns = 100 * kMs, .percent_given = 200}};
    world.add("generous", generous);
    world.add("slow", ownsAndAnswersAfter(0, 1500 * kMs));
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 1000}, {keys::kFinishEarly, true}}), 1500 * kMs);
  });
}

TEST(FinishEarly, GoesOnToTheNextUrgencyWhileTheAmountIsMissing) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour deep;
    deep.owns["/"] = sim::OwnedBytes{0, 400, 600, 0, 0};
    const auto service = world.add("deep", deep);
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 1000}, {keys::kFinishEarly, true}}), 0U);
    const Dictionary outcome = world.answers().back();
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 1000U);
    EXPECT_TRUE(outcome.contains("SPACEKEEP_URGENCY_2_OPERATION_INFO"));
    EXPECT_FALSE(outcome.contains("SPACEKEEP_URGENCY_3_OPERATION_INFO"));
  });
}

TEST(FinishEarly, AFailureOfTheLastServiceEndsTheWaitWhenTheAmountIsReached) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour failing = sim::ownsBytes("/", 1000);
    failing.purge = {
        sim::CallBehaviour{.answer = sim::Answer::kFailsDuringCall, .delay_ns = 300 * kMs}};
    world.add("dies after its work", failing);
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 1000}, {keys::kFinishEarly, true}}), 300 * kMs);
  });
}

TEST(FinishEarly, AShortfallWaitsAsLongAsEver) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("silent", answers(sim::Answer::kNever));
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 10}, {keys::kFinishEarly, true}}), 12 * kSecond);
  });
}

// With one byte missing between two, the first is put in flight without being asked. Nobody waits
// for an answer of it once the other one has freed what was missing.
TEST(FinishEarly, AServiceThatWasNeverAskedDoesNotHoldTheEnd) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("a", ownsAndAnswersAfter(1, 100 * kMs));
    sim::ServiceBehaviour generous = sim::ownsBytes("/", 100);
    generous.purge = {sim::CallBehaviour{.delay_ns = 200 * kMs, .percent_given = 200}};
    world.add("b", generous);
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 2}, {keys::kFinishEarly, true}}), 200 * kMs);
  });
}

TEST(FinishEarly, SpaceThatComesFromElsewhereBeforeTheNextUrgencyEndsIt) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.world.volumes().giveBack("/", 500, 1 * kSecond);
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 500}, {keys::kFinishEarly, true}}), 2 * kSecond);
  });
}

// Nobody is asked for what is there already, so nobody ends the wait.
TEST(FinishEarly, SpaceThatComesWhileAnUrgencyBeginsEndsItAtOnce) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    ActingStatistics statistics(world.platform.statistics, "SpacekeepPurgeAmountRequested",
                                [&] { world.world.volumes().giveBack("/", 500, 0); });
    Platform platform = withStatistics(world.platform, statistics);
    const auto operation = makeOperation<OpenPurgeOperation>(
        platform,
        Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 500}, {keys::kFinishEarly, true}},
        world.services);
    const std::uint64_t began = world.world.nowNs();
    static_cast<void>(world.run(*operation));
    EXPECT_EQ(world.world.nowNs() - began, 0U);
    world.world.shutDown();
  });
}

}  // namespace
}  // namespace spacekeep::test
