// A service that answers while the outcome is being filled in.
#include <gtest/gtest.h>

#include "tests/both/purge/purge_world.h"
#include "tests/helpers/schedules.h"
#include "tests/simulated/purge/acting_statistics.h"

namespace spacekeep::test {
namespace {

TEST(PurgeLateReport, AnAnswerWhileTheTotalIsCountedIsStillInTheReportedSum) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 1000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    const auto late = world.add("late", held);
    bool answered = false;
    // The freed bytes are counted before they are recorded.
    ActingStatistics statistics(world.platform.statistics, "total.purged", [&] {
      late->answerHeldCalls();
      answered = world.eventually([&] { return world.answers().size() == 1; });
    });
    Platform platform = withStatistics(world.platform, statistics);
    const auto operation = makeOperation<OpenPurgeOperation>(
        platform, Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 100}, {keys::kUrgency, 1}},
        world.services);
    const Dictionary outcome = world.run(*operation);
    EXPECT_TRUE(answered);
    // What was freed had been measured by then.
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 0U);
    EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 100U);
    world.world.shutDown();
  });
}

}  // namespace
}  // namespace spacekeep::test
