// Purges that end without waiting out a deadline, in many schedules and on real threads.
#include <gtest/gtest.h>

#include "purge/decisions.h"
#include "tests/both/purge/purge_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

// Long enough for a busy machine; no purge here waits it out.
constexpr int kPatientSeconds = 300;

TEST(PurgeConstruction, KeepsOnlyServicesThatPurge) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("gives", sim::ownsBytes("/", 10));
    world.add("keeps", sim::ownsBytes("/", 10), false);
    const auto operation = world.make({{keys::kAmount, 77}});
    ASSERT_EQ(operation->services().size(), 1U);
    EXPECT_TRUE(operation->services().contains("gives"));
    EXPECT_EQ(operation->viable_purging_services(), 1U);
    EXPECT_EQ(operation->purge_amount_needed(), 77U);
    EXPECT_EQ(operation->purge_amount_reported(), 0U);
    EXPECT_FALSE(operation->cancel());
    EXPECT_EQ(operation->purge_semaphore(), nullptr);
  });
}

TEST(PurgeConstruction, AnAbsentAmountCountsAsZeroBytes) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    EXPECT_EQ(world.make({})->purge_amount_needed(), 0U);
  });
}

TEST(PurgeConstruction, ARequestThatTheBaseRefusesMakesNoOperation) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    EXPECT_EQ(makeOperation<SpacekeepPurgeOperation>(world.platform, Dictionary{{keys::kAmount, 1}},
                                                     world.services),
              nullptr);
  });
}

TEST(Purge, OneServiceThatOwnsEnoughFreesTheAmount) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 5000));
    const Dictionary outcome = world.purge({{keys::kAmount, 1000},
                                            {keys::kUrgency, 1},
                                            {keys::kPurgeTimeout, kPatientSeconds},
                                            {"MINE", "echoed"}});
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 1000U);
    EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 1000U);
    EXPECT_EQ(unsignedAt(outcome, keys::kFreespaceBegin), 0U);
    EXPECT_EQ(unsignedAt(outcome, keys::kFreespaceEnd), 1000U);
    EXPECT_EQ(*outcome.find("MINE"), Value("echoed"));
    EXPECT_FALSE(outcome.contains(keys::kError));
    EXPECT_FALSE(outcome.contains(keys::kOperationCancelled));
    ASSERT_TRUE(outcome.contains(keys::kElapsedTime));
    EXPECT_LT(*outcome.find(keys::kElapsedTime)->asDouble(), 300.0);
    EXPECT_EQ(cache->callCount("servicePurge"), 1U);
  });
}

TEST(Purge, TheServiceIsAskedWithTheWholeRequestAndItsShare) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 5000));
    world.purge({{keys::kAmount, 1000},
                 {keys::kUrgency, 1},
                 {keys::kPurgeTimeout, kPatientSeconds},
                 {"MINE", "carried"}});
    const auto calls = cache->callsOf("servicePurge");
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].urgency, 1);
    EXPECT_EQ(calls[0].amount, 1000U);
    EXPECT_EQ(*calls[0].info.find("MINE"), Value("carried"));
    EXPECT_EQ(*calls[0].info.find(keys::kVolume), Value("/"));
    EXPECT_EQ(unsignedAt(calls[0].info, keys::kFreespaceBegin), 0U);
    EXPECT_EQ(unsignedAt(calls[0].info, keys::kUrgency), 1U);
  });
}

TEST(Purge, TheUrgencyRecordNamesWhatEachServiceReported) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("small", sim::ownsBytes("/", 30));
    const Dictionary outcome = world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const Dictionary record = dictionaryAt(outcome, "SPACEKEEP_URGENCY_1_OPERATION_INFO");
    EXPECT_EQ(dictionaryAt(record, keys::kReportingServices), (Dictionary{{"small", 30}}));
    EXPECT_EQ(*record.find("SPACEKEEP_OPERATION_STATS_URGENCY_1"),
              Value("amount reported: 30, amountPurged: 30, purge_amount_needed: 1000, "
                    "cancel: FALSE"));
    EXPECT_FALSE(record.contains(keys::kServicesInFlight));
    EXPECT_FALSE(outcome.contains("SPACEKEEP_URGENCY_2_OPERATION_INFO"));
  });
}

TEST(Purge, TheFreedAmountIsWhatTheVolumeShowsNotWhatServicesSay) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour boaster = sim::ownsBytes("/", 30);
    boaster.purge = {sim::CallBehaviour{.reported_extra = 100}};
    world.add("boaster", boaster);
    const Dictionary outcome = world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 30U);
    EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 130U);
  });
}

TEST(Purge, AnAmountThatIsNoNumberIsAnsweredWithAnErrorAndNothingElse) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 5000));
    const Dictionary outcome = world.purge({{keys::kAmount, "lots"}, {"MINE", "dropped"}});
    EXPECT_EQ(outcome, (Dictionary{{keys::kError, "Parameter error, no Amount key in info dict"}}));
    EXPECT_EQ(world.answers().size(), 1U);
    EXPECT_TRUE(world.world.trace().hasLine("startOperation 90 amount is not a number: lots"));
    EXPECT_TRUE(world.world.statistics().keys().empty());
    EXPECT_TRUE(cache->calls().empty());
  });
}

TEST(Purge, AnAbsentAmountIsAnsweredWithTheSameError) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const Dictionary outcome = world.purge({});
    EXPECT_EQ(outcome, (Dictionary{{keys::kError, "Parameter error, no Amount key in info dict"}}));
    EXPECT_EQ(world.lines("%s %d amount is not a number: %@"), 1U);
  });
}

TEST(Purge, SendsItsStatisticsUnderTheirKeys) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("small", sim::ownsBytes("/", 300));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const auto& statistics = world.world.statistics();
    EXPECT_EQ(statistics.distribution("SpacekeepPurgeAmountRequested"),
              std::vector<double>{1000.0});
    EXPECT_EQ(statistics.distribution("SpacekeepPurgeAmountPurged"), std::vector<double>{300.0});
    EXPECT_EQ(statistics.distribution("SpacekeepPurgeDeficit"), std::vector<double>{700.0});
    EXPECT_EQ(statistics.distribution("SpacekeepPurgeElapsedNanoseconds").size(), 1U);
    EXPECT_EQ(statistics.reported("SpacekeepPurgeFailed"), 1);
    EXPECT_EQ(statistics.reported("total.purged.30.percent"), 1);
    EXPECT_EQ(statistics.reported("total.purged"), 300);
    EXPECT_EQ(statistics.reported("small.purged.30.percent"), 1);
    EXPECT_EQ(statistics.reported("small.purged"), 300);
    EXPECT_TRUE(statistics.onlyTheDaemonsDomain());
  });
}

TEST(Purge, AReachedAmountIsNoFailure) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("cache", sim::ownsBytes("/", 5000));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const auto& statistics = world.world.statistics();
    EXPECT_EQ(statistics.timesReported("SpacekeepPurgeFailed"), 0U);
    EXPECT_TRUE(statistics.distribution("SpacekeepPurgeDeficit").empty());
    EXPECT_EQ(statistics.reported("total.purged.100.percent"), 1);
  });
}

TEST(Purge, EveryServiceAnswerReachesTheCompletionBeforeTheOutcome) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    // Both are asked before the first of them answers and can end the wait.
    world.add("a", ownsAndAnswersAfter(10, 10 * kSecond));
    world.add("b", ownsAndAnswersAfter(20, 10 * kSecond));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const auto seen = world.answers();
    ASSERT_EQ(seen.size(), 3U);
    std::uint64_t sum = 0;
    for (std::size_t i = 0; i < 2; ++i) {
      sum += unsignedAt(seen[i], keys::kAmount).value_or(0);
      EXPECT_TRUE(seen[i].contains(keys::kElapsedTime));
      EXPECT_FALSE(seen[i].contains(keys::kVolume));
    }
    EXPECT_EQ(sum, 30U);
    EXPECT_TRUE(seen[2].contains("SPACEKEEP_URGENCY_1_OPERATION_INFO"));
  });
}

TEST(Purge, RunsWithoutACompletionAsWell) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 5000));
    const auto operation = world.make(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    operation->startOperation(nullptr);
    EXPECT_EQ(world.lines("%s result %@"), 1U);
    EXPECT_EQ(operation->purge_amount_reported(), 1000U);
    EXPECT_EQ(cache->callCount("servicePurge"), 1U);
    EXPECT_TRUE(
        world.eventually([&] { return world.lines("%s %@ took %f seconds, purged: %@") == 1; }));
    EXPECT_EQ(world.lines("%s %@ calling completion with: %@"), 0U);
  });
}

TEST(Purge, WithoutACompletionAnAmountThatIsNoNumberIsRefusedInSilence) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.make({{keys::kAmount, "lots"}})->startOperation(nullptr);
    EXPECT_EQ(world.lines("%s %d amount is not a number: %@"), 1U);
    EXPECT_EQ(world.lines("%s result %@"), 0U);
  });
}

TEST(Purge, LogsItsCourseInTheExactFormats) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("small", sim::ownsBytes("/", 30));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const auto& trace = world.world.trace();
    EXPECT_TRUE(trace.hasLine("startOperation user_timeout_seconds: 300"));
    EXPECT_EQ(world.lines("%s urgencyLimit: %d, info at start: %@"), 1U);
    EXPECT_TRUE(trace.hasLine("startOperation IN QUEUE, amountPurged: 0"));
    EXPECT_TRUE(trace.hasLine("startOperation Urgency: 1"));
    EXPECT_TRUE(trace.hasLine(
        "startOperation waiting for 300 seconds, user_timeout_seconds: 300, currentUrgency: 1"));
    EXPECT_TRUE(trace.hasLine(
        "startOperation SPACEKEEP_OPERATION_STATS_URGENCY_1 : amount reported: 30, amountPurged: "
        "30, purge_amount_needed: 1000, cancel: FALSE"));
    EXPECT_EQ(world.lines("%s result %@"), 1U);
  });
}

TEST(PurgeRequest, LogsItsCourseInTheExactFormats) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("small", sim::ownsBytes("/", 30));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    const auto& trace = world.world.trace();
    EXPECT_TRUE(trace.hasLine("queueServiceRequest queuing service: small"));
    EXPECT_TRUE(trace.hasLine(
        "queueServiceRequest donation (1000) = (amount needed[1000] - amount_purged[0]) / "
        "viable_purging_services[1])"));
    EXPECT_TRUE(trace.hasLine("queueServiceRequest requesting 1000 bytes from small at urgency 1"));
    EXPECT_TRUE(trace.hasLine("queueServiceRequest small service purged: 30"));
    EXPECT_EQ(world.lines("%s %@ calling completion with: %@"), 1U);
    EXPECT_TRUE(
        trace.hasLine("queueServiceRequest All services accounted for, signalling the semaphore."));
    EXPECT_TRUE(trace.hasLine("updateInFlight adding small"));
    EXPECT_TRUE(trace.hasLine("updateInFlight removing small"));
  });
}

// The line follows the signal, so it may come after the purge has ended.
TEST(PurgeRequest, LogsAndCountsHowLongTheServiceTook) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    world.add("small", sim::ownsBytes("/", 30));
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    EXPECT_TRUE(world.eventually([&] {
      return world.lines("%s %@ took %f seconds, purged: %@") == 1 &&
             world.world.statistics().distribution("small_purgeElapsedNanoseconds").size() == 1;
    }));
  });
}

TEST(PurgeRequest, AReplyThatIsNoNumberCountsAsZeroAndIsLoggedWithItsNumber) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto talker = world.add("talker", answers(sim::Answer::kRepliesWithText));
    const Dictionary outcome = world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 0U);
    EXPECT_TRUE(world.world.trace().hasLine("queueServiceRequest 239 num is not a number: plenty"));
    EXPECT_EQ(talker->callCount("servicePurge"), 1U);
  });
}

TEST(PurgeRequest, AReplyWithoutAmountOrWithNothingCountsAsZero) {
  for (const auto answer : {sim::Answer::kRepliesWithoutAmount, sim::Answer::kRepliesNothing}) {
    inEverySchedule(kSchedules, [&] {
      PurgeWorld world;
      world.add("quiet", answers(answer));
      const Dictionary outcome = world.purge(
          {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
      EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 0U);
      EXPECT_TRUE(
          world.world.trace().hasLine("queueServiceRequest 239 num is not a number: (none)"));
      const Dictionary record = dictionaryAt(outcome, "SPACEKEEP_URGENCY_1_OPERATION_INFO");
      EXPECT_EQ(dictionaryAt(record, keys::kReportingServices), (Dictionary{{"quiet", 0}}));
    });
  }
}

TEST(PurgeRequest, NobodyIsEverAskedTwiceAtOnce) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    std::vector<std::shared_ptr<sim::SimulatedService>> services;
    for (const char* name : {"a", "b", "c"}) {
      services.push_back(world.add(name, sim::ownsBytes("/", 40)));
    }
    world.purge(
        {{keys::kAmount, 1000}, {keys::kUrgency, 1}, {keys::kPurgeTimeout, kPatientSeconds}});
    for (const auto& service : services) EXPECT_EQ(service->askedTwiceAtOnce(), 0U);
  });
}

TEST(PurgeProgress, ARequestForNothingHasNoBucketAndStillATotal) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto operation = world.make({{keys::kAmount, 0}});
    operation->reportPercentageForAmountRequested(0, 55, "cache");
    const auto& statistics = world.world.statistics();
    EXPECT_EQ(statistics.keys(), std::vector<std::string>{"cache.purged"});
    EXPECT_EQ(statistics.reported("cache.purged"), 55);
    EXPECT_TRUE(
        world.world.trace().hasLine("reportPercentageForAmountRequested cache donated 55 of 0"));
  });
}

TEST(PurgeProgress, CountsTheBucketOnceAndTheBytes) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto operation = world.make({{keys::kAmount, 0}});
    operation->reportPercentageForAmountRequested(1000, 1500, "cache");
    const auto& statistics = world.world.statistics();
    EXPECT_EQ(statistics.reported("cache.purged.150.percent"), 1);
    EXPECT_EQ(statistics.reported("cache.purged"), 1500);
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogTrace),
              (std::vector<std::string>{
                  "reportPercentageForAmountRequested cache.purged.150.percent",
                  "reportPercentageForAmountRequested cache donated 1500 of 1000"}));
  });
}

TEST(PurgeCancel, WithNothingInFlightOnlySetsTheFlag) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto cache = world.add("cache", sim::ownsBytes("/", 10));
    const auto operation = world.make({{keys::kAmount, 10}});
    operation->cancelOperation();
    EXPECT_TRUE(operation->cancel());
    world.world.shutDown();
    EXPECT_TRUE(cache->calls().empty());
  });
}

TEST(PurgeCancel, TwiceAsksEachServiceInFlightOncePerCall) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    const auto a = world.add("a", {});
    const auto b = world.add("b", {});
    const auto idle = world.add("idle", {});
    const auto operation = world.make({{keys::kAmount, 10}});
    operation->updateInFlight("a", true);
    operation->updateInFlight("b", true);
    operation->cancelOperation();
    operation->cancelOperation();
    EXPECT_TRUE(operation->cancel());
    EXPECT_TRUE(world.eventually([&] {
      return a->callCount("serviceCancelPurge") == 2 && b->callCount("serviceCancelPurge") == 2;
    }));
    EXPECT_EQ(operation->inFlightCount(), 2U);
    EXPECT_TRUE(idle->calls().empty());
  });
}

TEST(PurgeCancel, AFailingConnectionIsLoggedAndLeavesTheServiceInFlight) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour failing;
    failing.cancel.answer = sim::Answer::kFailsBeforeCall;
    world.add("a", failing);
    const auto operation = world.make({{keys::kAmount, 10}});
    operation->updateInFlight("a", true);
    operation->cancelOperation();
    EXPECT_TRUE(world.eventually(
        [&] { return world.world.trace().hasLine("cancelOperation connection invalidated"); }));
    EXPECT_EQ(operation->inFlightCount(), 1U);
  });
}

}  // namespace
}  // namespace spacekeep::test
