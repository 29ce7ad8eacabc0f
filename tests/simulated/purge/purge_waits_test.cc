// How long a purge takes, to the nanosecond of virtual time.
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/both/purge/purge_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Runs a purge and answers how much virtual time it took.
std::uint64_t durationOf(PurgeWorld& world, Dictionary request) {
  const std::uint64_t start_ns = world.world.nowNs();
  world.purge(std::move(request));
  return world.world.nowNs() - start_ns;
}

TEST(PurgeWaits, ARequestForNothingWaitsOutEveryUrgencyUpToTheLimit) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 100));
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 0}}), 12 * kSecond);
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.lines("%s Urgency: %d"), 0U);
    EXPECT_EQ(world.lines("%s timed out waiting for: %@"), 3U);
  });
}

TEST(PurgeWaits, AtLimitFourTheWaitsSumToTwentySeconds) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 0}, {keys::kUrgency, 4}}), 20 * kSecond);
  });
}

TEST(PurgeWaits, AnAmountReachedAtUrgencyOneStillWaitsOutTheLaterUrgencies) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 1000));
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 1000}}), 10 * kSecond);
    EXPECT_EQ(cache->callCount("servicePurge"), 1U);
  });
}

TEST(PurgeWaits, AUserTimeoutIsLoggedAsAskedAndUsedAsThreeHundredSeconds) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("silent", answers(sim::Answer::kNever));
    EXPECT_EQ(
        durationOf(world, {{keys::kAmount, 10}, {keys::kUrgency, 2}, {keys::kPurgeTimeout, 1000}}),
        600 * kSecond);
    EXPECT_TRUE(world.world.trace().hasLine("startOperation user_timeout_seconds: 1000"));
    EXPECT_TRUE(world.world.trace().hasLine(
        "startOperation waiting for 300 seconds, user_timeout_seconds: 300, currentUrgency: 1"));
  });
}

TEST(PurgeWaits, AUserTimeoutOfZeroOrOfAnotherKindMeansTwoSecondsPerUrgency) {
  for (const Value& timeout : {Value(0), Value("300"), Value(true)}) {
    inEverySchedule(kSchedules, [&] {
      PurgeWorld world;
      EXPECT_EQ(durationOf(world, {{keys::kAmount, 10}, {keys::kPurgeTimeout, timeout}}),
                12 * kSecond);
    });
  }
}

TEST(PurgeWaits, AUserTimeoutHoldsForEveryUrgency) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    EXPECT_EQ(durationOf(world, {{keys::kAmount, 10}, {keys::kPurgeTimeout, 5}}), 15 * kSecond);
  });
}

TEST(PurgeWaits, WithUrgencyLimitZeroNobodyIsAskedAndNothingWaits) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 1000));
    const auto operation = world.make({{keys::kAmount, 1000}});
    operation->setUrgencyLimit(0);
    const std::uint64_t start_ns = world.world.nowNs();
    const Dictionary outcome = world.run(*operation);
    EXPECT_EQ(world.world.nowNs(), start_ns);
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 0U);
    EXPECT_EQ(outcome.find(keys::kElapsedTime)->asDouble(), 0.0);
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.world.statistics().reported("SpacekeepPurgeFailed"), 1);
    EXPECT_TRUE(world.world.statistics().distribution("SpacekeepPurgeAmountRequested").empty());
  });
}

TEST(PurgeWaits, WithoutAPurgingServiceEveryUrgencyTimesOutAndNobodyIsViable) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("keeps", sim::ownsBytes("/", 1000), false);
    const auto operation = world.make({{keys::kAmount, 1000}});
    const std::uint64_t start_ns = world.world.nowNs();
    const Dictionary outcome = world.run(*operation);
    EXPECT_EQ(world.world.nowNs() - start_ns, 12 * kSecond);
    EXPECT_EQ(operation->viable_purging_services(), 0U);
    EXPECT_EQ(world.lines("%s timed out waiting for: %@"), 3U);
    EXPECT_EQ(world.lines("%s queuing service: %@"), 0U);
    const Dictionary record = dictionaryAt(outcome, "SPACEKEEP_URGENCY_3_OPERATION_INFO");
    EXPECT_EQ(*record.find(keys::kServicesInFlight), Value(Array{}));
    EXPECT_EQ(unsignedAt(record, "SPACEKEEP_URGENCY_3_TIMEOUT_SECONDS"), 6U);
  });
}

TEST(PurgeWaits, TheRequestedAmountIsCountedOncePerUrgency) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    durationOf(world, {{keys::kAmount, 7}});
    EXPECT_EQ(world.world.statistics().distribution("SpacekeepPurgeAmountRequested"),
              (std::vector<double>{7.0, 7.0, 7.0}));
    EXPECT_EQ(world.world.statistics().distribution("SpacekeepPurgeElapsedNanoseconds"),
              std::vector<double>{12e9});
  });
}

TEST(PurgeWaits, ASilentServiceIsNamedInEachRecordAndAskedToStopAtTheEnd) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto silent = world.add("silent", answers(sim::Answer::kNever));
    const Dictionary outcome = world.purge({{keys::kAmount, 10}});
    for (const char* urgency : {"1", "2", "3"}) {
      const std::string number = urgency;
      const Dictionary record =
          dictionaryAt(outcome, "SPACEKEEP_URGENCY_" + number + "_OPERATION_INFO");
      EXPECT_EQ(*record.find(keys::kServicesInFlight), Value(Array{"silent"}));
      EXPECT_TRUE(record.contains("SPACEKEEP_URGENCY_" + number + "_TIMEOUT_SECONDS"));
    }
    const auto problems = world.world.trace().linesOfLevel(kLogProblem);
    EXPECT_EQ(std::ranges::count(problems, "startOperation timed out waiting for: [\"silent\"]"),
              3);
    EXPECT_TRUE(world.world.trace().hasLine("startOperation cancelling purge"));
    EXPECT_TRUE(world.eventually([&] { return silent->callCount("serviceCancelPurge") == 1; }));
    EXPECT_EQ(silent->callCount("servicePurge"), 1U);
    // From the second urgency on there is nobody to divide among: the request ends with its first
    // line and does not reach the services in flight.
    EXPECT_EQ(world.lines("%s queuing service: %@"), 3U);
    EXPECT_EQ(world.lines("%s donation (%lld) = (amount needed[%llu] - amount_purged[%llu]) / "
                          "viable_purging_services[%llu])"),
              1U);
    EXPECT_EQ(world.lines("%s trying to add \"%@\", which is already inFlight"), 0U);
  });
}

TEST(PurgeWaits, TheElapsedTimeIsInSecondsInTheOutcomeAndNanosecondsInAnAnswer) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("slow", ownsAndAnswersAfter(5, 1500 * kMs));
    const Dictionary outcome = world.purge({{keys::kAmount, 10}, {keys::kUrgency, 1}});
    EXPECT_EQ(outcome.find(keys::kElapsedTime)->asDouble(), 1.5);
    EXPECT_EQ(world.answers().front().find(keys::kElapsedTime)->asDouble(), 1.5e9);
    EXPECT_TRUE(world.eventually([&] {
      return world.world.statistics().distribution("slow_purgeElapsedNanoseconds") ==
             std::vector<double>{1.5e9};
    }));
    EXPECT_EQ(world.world.trace().linesWithFormat("%s %@ took %f seconds, purged: %@").size(), 1U);
    EXPECT_NE(world.world.trace()
                  .linesWithFormat("%s %@ took %f seconds, purged: %@")
                  .front()
                  .find("slow took 1.500000 seconds, purged: {"),
              std::string::npos);
  });
}

TEST(PurgeWaits, CancelBeforeUrgencyTwoLeavesOnlyTheFirstRecord) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto silent = world.add("silent", answers(sim::Answer::kNever));
    const auto operation = world.make({{keys::kAmount, 10}});
    world.world.after(1 * kSecond, [operation] { operation->cancelOperation(); });
    const std::uint64_t start_ns = world.world.nowNs();
    const Dictionary outcome = world.run(*operation);
    EXPECT_EQ(world.world.nowNs() - start_ns, 2 * kSecond);
    EXPECT_EQ(*outcome.find(keys::kOperationCancelled), Value(true));
    const Dictionary record = dictionaryAt(outcome, "SPACEKEEP_URGENCY_1_OPERATION_INFO");
    EXPECT_EQ(*record.find("SPACEKEEP_OPERATION_STATS_URGENCY_1"),
              Value("amount reported: 0, amountPurged: 0, purge_amount_needed: 10, cancel: TRUE"));
    EXPECT_FALSE(outcome.contains("SPACEKEEP_URGENCY_2_OPERATION_INFO"));
    // Once from the cancel itself, once more because the purge fell short with it in flight.
    EXPECT_TRUE(world.eventually([&] { return silent->callCount("serviceCancelPurge") == 2; }));
  });
}

TEST(PurgeWaits, CancelledBeforeItStartsItAsksNobody) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 1000));
    const auto operation = world.make({{keys::kAmount, 1000}});
    operation->setCancel(true);
    const Dictionary outcome = world.run(*operation);
    EXPECT_EQ(*outcome.find(keys::kOperationCancelled), Value(true));
    EXPECT_FALSE(outcome.contains("SPACEKEEP_URGENCY_1_OPERATION_INFO"));
    EXPECT_TRUE(cache->calls().empty());
  });
}

}  // namespace
}  // namespace spacekeep::test
