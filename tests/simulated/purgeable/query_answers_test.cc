// What becomes of the answers of services to a query. On virtual time, because the result depends
// on who has answered before the wait is over.
#include <gtest/gtest.h>

#include <algorithm>

#include "support/runtime/simulation.h"
#include "support/values/text.h"
#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

TEST(QueryAnswers, AreSummedAndItemized) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", couldFree(5));
    world.world.declareService("b", couldFree(6));
    world.start();
    EXPECT_EQ(world.query(), resultOf({{"a", 5}, {"b", 6}}, 11));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(QueryAnswers, EveryServiceGetsTheUrgencyLimitAndTheWholeRequest) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(5));
    world.start();
    const Dictionary request{{keys::kVolume, "/"}, {keys::kUrgency, 2}, {"MINE", Array{1}}};
    world.query(request);
    const auto calls = cache->callsOf("servicePurgeable");
    ASSERT_EQ(calls.size(), 1U);
    EXPECT_EQ(calls[0].urgency, 2);
    EXPECT_EQ(calls[0].info, request);
  });
}

TEST(QueryAnswers, NoAnswerAtAllIsRecordedWithAmountZeroAndCountsAsAnAnswer) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto quiet =
        world.world.declareService("quiet", answersQueries(sim::Answer::kRepliesNothing));
    world.start();
    EXPECT_EQ(world.query(), resultOf({{"quiet", 0}}, 0));
    EXPECT_EQ(world.remembered(), (Dictionary{{"quiet", 0}}));
    const auto took = world.filled("%s %@ took %f seconds, returned: %@");
    ASSERT_EQ(took.size(), 1U);
    EXPECT_EQ(took[0], "startOperation quiet took 0.000000 seconds, returned: (none)");
    // It has answered, so the next query does not ask it.
    EXPECT_EQ(world.query(), resultOf({{"quiet", 0}}, 0));
    EXPECT_EQ(quiet->callCount("servicePurgeable"), 1U);
  });
}

TEST(QueryAnswers, AnAnswerThatNamesNoAmountIsRecordedWithZero) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("vague", answersQueries(sim::Answer::kRepliesWithoutAmount, 7));
    world.start();
    EXPECT_EQ(world.query(), resultOf({{"vague", 0}}, 0));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(QueryAnswers, AnAmountThatIsATextIsRecordedAsItCameAndLeftOutOfTheTotal) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", couldFree(5));
    world.world.declareService("talker", answersQueries(sim::Answer::kRepliesWithText));
    world.start();
    EXPECT_EQ(world.query(), resultOf({{"cache", 5}, {"talker", "plenty"}}, 5));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{"startOperation 163 talker num is not a number: plenty"});
  });
}

TEST(QueryAnswers, AServiceWhoseConnectionFailsIsNotCountedAndTheResultHoldsNoError) {
  for (const auto answer : {sim::Answer::kFailsBeforeCall, sim::Answer::kFailsDuringCall}) {
    inEverySchedule(kSchedules, [&] {
      QueryWorld world;
      world.world.declareService("broken", answersQueries(answer, 7));
      world.world.declareService("cache", couldFree(5));
      world.start();
      EXPECT_EQ(world.query(), resultOf({{"cache", 5}}, 5));
      EXPECT_EQ(world.filled("%s connection invalidated: %@"),
                std::vector<std::string>{"startOperation connection invalidated: broken"});
      EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: []"));
      EXPECT_EQ(world.remembered(), (Dictionary{{"cache", 5}}));
    });
  }
}

/// A query that runs while the daemon comes to remember `record`, 20 ms after it has begun.
Dictionary queryWhileRemembering(QueryWorld& world, const SpacekeepRecentInfo& record) {
  Dictionary result;
  rt::Thread asking("asking", [&] { result = world.query(); });
  rt::sleepNs(20 * kMs);
  world.remember(record);
  asking.join();
  return result;
}

TEST(QueryAnswers, AServiceThatFailsWhileItIsAskedIsCountedFromWhatCameToBeRemembered) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto broken = world.world.declareService(
        "broken", answersQueries(sim::Answer::kFailsDuringCall, 7, 50 * kMs));
    world.start();
    EXPECT_EQ(queryWhileRemembering(world, recordOf("/", "broken", 9)),
              resultOf({{"broken", 9}}, 9));
    EXPECT_EQ(broken->callCount("servicePurgeable"), 1U);
    EXPECT_EQ(world.filled("%s connection invalidated: %@"),
              std::vector<std::string>{"startOperation connection invalidated: broken"});
    EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: []"));
  });
}

TEST(QueryAnswers, AServiceThatStaysSilentIsCountedFromWhatCameToBeRemembered) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto silent = world.world.declareService("silent", answersQueries(sim::Answer::kNever));
    world.start();
    EXPECT_EQ(queryWhileRemembering(world, recordOf("/", "silent", 9)),
              resultOf({{"silent", 9}}, 9));
    EXPECT_EQ(silent->callCount("servicePurgeable"), 1U);
    EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: [\"silent\"]"));
  });
}

TEST(QueryAnswers, WithoutAStateToRememberThemInEveryQueryAsksAndSumsUpNothing) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.disk().refuseToOpen(true);
    const auto cache = world.world.declareService("cache", couldFree(5));
    world.start();
    EXPECT_EQ(world.query(), resultOf({}, 0));
    EXPECT_EQ(world.query(), resultOf({}, 0));
    EXPECT_EQ(cache->callCount("servicePurgeable"), 2U);
  });
}

TEST(QueryAnswers, AnOptOutOfAnyValueIsNotedAndTheAmountCountedAllTheSame) {
  for (const Value& opt_out : {Value(true), Value(false), Value(0), Value("please")}) {
    inEverySchedule(10, [&] {
      QueryWorld world;
      sim::ServiceBehaviour behaviour = couldFree(5);
      behaviour.opt_out = opt_out;
      world.world.declareService("shy", behaviour);
      world.start();
      const auto operation = world.make();
      EXPECT_EQ(world.run(*operation), resultOf({{"shy", 5}}, 5));
      EXPECT_EQ(world.remembered(), (Dictionary{{"shy", 5}}));
      EXPECT_TRUE(operation->optOutService("shy", false));
      const auto lines = world.filled("%s %@ has %@, skipping");
      ASSERT_EQ(lines.size(), 1U);
      const Dictionary answer{{"SPACEKEEP_AMOUNT", 5}, {"SPACEKEEP_OPT_OUT", opt_out}};
      EXPECT_EQ(lines[0].rfind("startOperation shy has {\"SIMULATED_CALL\": ", 0), 0U) << lines[0];
      EXPECT_TRUE(lines[0].ends_with(textOf(answer).substr(1) + ", skipping")) << lines[0];
    });
  }
}

TEST(QueryAnswers, WithoutAnOptOutNobodyIsOptedOut) {
  inEverySchedule(10, [] {
    QueryWorld world;
    world.world.declareService("cache", couldFree(5));
    world.world.declareService("quiet", answersQueries(sim::Answer::kRepliesNothing));
    world.start();
    const auto operation = world.make();
    world.run(*operation);
    EXPECT_FALSE(operation->optOutService("cache", false));
    EXPECT_FALSE(operation->optOutService("quiet", false));
    EXPECT_EQ(world.lines("%s %@ has %@, skipping"), 0U);
  });
}

TEST(QueryAnswers, AnOptOutHoldsForLessThanTwoMinutes) {
  constexpr std::int64_t kTwoMinutesNs = 120'000'000'000;
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    EXPECT_FALSE(operation->optOutService("shy", true));
    EXPECT_TRUE(operation->optOutService("shy", false));
    rt::jumpWallClockNs(kTwoMinutesNs - 1);
    EXPECT_TRUE(operation->optOutService("shy", false));
    EXPECT_FALSE(operation->optOutService("other", false));
  });
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    const auto operation = world.make();
    EXPECT_FALSE(operation->optOutService("shy", true));
    rt::jumpWallClockNs(kTwoMinutesNs);
    EXPECT_FALSE(operation->optOutService("shy", false));
    // The entry is gone: by its date it would hold again.
    rt::jumpWallClockNs(-kTwoMinutesNs);
    EXPECT_FALSE(operation->optOutService("shy", false));
  });
}

TEST(QueryAnswers, TheNextQueryAsksAServiceThatOptedOutAgain) {
  inEverySchedule(10, [] {
    QueryWorld world;
    sim::ServiceBehaviour behaviour = couldFree(5);
    behaviour.opt_out = true;
    const auto shy = world.world.declareService("shy", behaviour);
    world.start();
    world.query();
    EXPECT_TRUE(world.set(keys::kRecentServiceStats, std::nullopt));
    world.query();
    EXPECT_EQ(shy->callCount("servicePurgeable"), 2U);
  });
}

/// The trace lines since line `before`, without those of reading and writing the state.
std::vector<std::string> courseSince(const QueryWorld& world, std::size_t before) {
  std::vector<std::string> lines = world.traces();
  lines.erase(lines.begin(), lines.begin() + static_cast<std::ptrdiff_t>(before));
  std::erase_if(lines, [](const std::string& line) {
    return line.starts_with("clientGetStateSync ") || line.starts_with("_clientGetState ");
  });
  return lines;
}

TEST(QueryAnswers, AQueryTracesItsCourseInTheExactFormats) {
  // The service's part runs beside the query's own.
  const std::vector<std::string> of_service = {
      "startOperation ^^^asking cache for urgency 3",
      "startOperation cache took 0.005000 seconds, returned: {\"SIMULATED_CALL\": 1, "
      "\"SPACEKEEP_AMOUNT\": 5}",
      "updateInFlight removing cache",
      "updateServiceStats ^^^ENTRY, serviceID: cache : {\"SPACEKEEP_AMOUNT\": 5, "
      "\"SPACEKEEP_VOLUME\": \"/\"}, recentInfo: (none)"};
  inEverySchedule(kSchedules, [&] {
    QueryWorld world;
    world.world.declareService("cache", couldFree(5, 5 * kMs));
    world.start();
    const std::size_t before = world.traces().size();
    world.query();
    std::vector<std::string> lines = courseSince(world, before);
    const auto is_of_service = [&](const std::string& line) {
      return std::ranges::count(of_service, line) != 0;
    };
    EXPECT_EQ(std::ranges::count_if(lines, is_of_service), 4);
    std::erase_if(lines, is_of_service);
    EXPECT_EQ(lines,
              (std::vector<std::string>{
                  "startOperation ENTRY, info: {\"SPACEKEEP_VOLUME\": \"/\"}",
                  "cachedInfo servicesToCount: {}", "cachedInfo servicesToQuery: [\"cache\"]",
                  "updateInFlight adding cache", "startOperation ^^^waiting for a little bit",
                  "startOperation --------- tick --------- 0 ---------",
                  "startOperation ^^^beat the timeout, woohoo!",
                  "startOperation ^^^done waiting, inFlight: []",
                  "cachedInfo servicesToCount: {\"cache\": 5}", "cachedInfo using all cached info",
                  "startOperation cachedInfo (2nd pass): {\"SPACEKEEP_SERVICES_TO_COUNT\": "
                  "{\"cache\": 5}, \"SPACEKEEP_SERVICES_TO_QUERY\": []}",
                  "startOperation Still in flight: []",
                  "startOperation elapsed time: 0.010000 result: {\"SPACEKEEP_TOTAL_AVAILABLE\": "
                  "5, \"SPACEKEEP_VOLUME\": \"/\", \"cache\": 5}"}));
  });
}

}  // namespace
}  // namespace spacekeep::test
