// How long a query takes, to the nanosecond of virtual time.
#include <gtest/gtest.h>

#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kWaiting = "%s ^^^waiting for a little bit";
constexpr const char* kBeaten = "%s ^^^beat the timeout, woohoo!";
constexpr const char* kTick = "%s --------- %s --------- %llu ---------";
constexpr const char* kDoneWaiting = "%s ^^^done waiting, inFlight: %@";

/// Runs a query and answers how much virtual time it took.
std::uint64_t durationOf(QueryWorld& world, Dictionary request, const Dictionary& expected) {
  const std::uint64_t start_ns = world.world.nowNs();
  EXPECT_EQ(world.query(std::move(request)), expected);
  return world.world.nowNs() - start_ns;
}

std::string tickLine(unsigned tick) {
  return std::string("startOperation --------- ") + (tick % 2 == 0 ? "tick" : "tock") +
         " --------- " + std::to_string(tick) + " ---------";
}

/// The lines of ticks `first` to 14.
void addTicks(std::vector<std::string>& lines, unsigned first) {
  for (unsigned tick = first; tick < 15; ++tick) lines.push_back(tickLine(tick));
}

TEST(QueryWaits, AServiceThatNeverAnswersIsWaitedForFifteenTimesTenMilliseconds) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", couldFree(5));
    world.world.declareService("silent", answersQueries(sim::Answer::kNever, 7));
    world.start();
    EXPECT_EQ(durationOf(world, {{keys::kUrgency, 3}}, resultOf({{"cache", 5}}, 5)), 150 * kMs);
    std::vector<std::string> ticks;
    addTicks(ticks, 0);
    EXPECT_EQ(world.filled(kTick), ticks);
    EXPECT_EQ(world.filled(kWaiting),
              std::vector<std::string>{"startOperation ^^^waiting for a little bit"});
    EXPECT_EQ(world.filled(kDoneWaiting),
              std::vector<std::string>{"startOperation ^^^done waiting, inFlight: [\"silent\"]"});
    EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: [\"silent\"]"));
    EXPECT_EQ(world.lines(kBeaten), 0U);
    EXPECT_EQ(world.lines("%s maxExtensions: %d"), 0U);
  });
}

TEST(QueryWaits, TheUsualLimitIsWaitedForAsAtUrgencyThree) {
  for (const int urgency : {0, 1, 2, 3, 9}) {
    inEverySchedule(4, [&] {
      QueryWorld world;
      world.world.declareService("silent", answersQueries(sim::Answer::kNever));
      world.start();
      EXPECT_EQ(durationOf(world, {{keys::kUrgency, urgency}}, resultOf({}, 0)), 150 * kMs);
    });
  }
}

TEST(QueryWaits, AtUrgencyFourFiveExtensionsMakeItEightyFiveTicks) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("silent", answersQueries(sim::Answer::kNever));
    world.start();
    EXPECT_EQ(durationOf(world, {{keys::kUrgency, 4}}, resultOf({}, 0)), 850 * kMs);
    EXPECT_EQ(world.filled("%s maxExtensions: %d"),
              (std::vector<std::string>{
                  "startOperation maxExtensions: 5", "startOperation maxExtensions: 4",
                  "startOperation maxExtensions: 3", "startOperation maxExtensions: 2",
                  "startOperation maxExtensions: 1"}));
    std::vector<std::string> ticks;
    addTicks(ticks, 0);
    for (int extension = 0; extension < 5; ++extension) addTicks(ticks, 1);
    EXPECT_EQ(ticks.size(), 85U);
    EXPECT_EQ(world.filled(kTick), ticks);
    EXPECT_EQ(world.lines(kWaiting), 1U);
    EXPECT_EQ(world.lines(kDoneWaiting), 1U);
  });
}

TEST(QueryWaits, AnAnswerEndsTheWaitAtTheNextTick) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("slow", couldFree(5, 35 * kMs));
    world.start();
    EXPECT_EQ(durationOf(world, {}, resultOf({{"slow", 5}}, 5)), 40 * kMs);
    EXPECT_EQ(world.filled(kBeaten),
              std::vector<std::string>{"startOperation ^^^beat the timeout, woohoo!"});
    EXPECT_EQ(world.lines(kTick), 4U);
    EXPECT_EQ(world.filled(kDoneWaiting),
              std::vector<std::string>{"startOperation ^^^done waiting, inFlight: []"});
    EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: []"));
  });
}

TEST(QueryWaits, AnAnswerDuringAnExtensionIsCounted) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("slow", couldFree(5, 345 * kMs));
    world.start();
    EXPECT_EQ(durationOf(world, {{keys::kUrgency, 4}}, resultOf({{"slow", 5}}, 5)), 350 * kMs);
    EXPECT_EQ(world.filled("%s maxExtensions: %d"),
              (std::vector<std::string>{"startOperation maxExtensions: 5",
                                        "startOperation maxExtensions: 4"}));
  });
}

// Who wins the race is up to the schedule: either everyone has left before the group's wait is
// over, and nothing is waited for, or somebody has not.
TEST(QueryWaits, WhenNobodyIsStillInFlightAfterTheAskingTheWaitIsSkipped) {
  unsigned skipped = 0;
  inEverySchedule(200, [&skipped] {
    QueryWorld world;
    world.world.declareService("a", couldFree(5));
    world.world.declareService("broken", answersQueries(sim::Answer::kFailsBeforeCall));
    world.start();
    const std::uint64_t duration_ns = durationOf(world, {}, resultOf({{"a", 5}}, 5));
    if (world.lines(kWaiting) != 0) return;
    ++skipped;
    EXPECT_EQ(duration_ns, 0U);
    EXPECT_EQ(world.lines(kTick), 0U);
    EXPECT_EQ(world.lines(kBeaten), 0U);
    EXPECT_EQ(world.lines(kDoneWaiting), 0U);
  });
  EXPECT_GT(skipped, 0U);
}

// Every worker is busy, so that nobody can be asked.
TEST(QueryWaits, TheAskingItselfIsWaitedForTenSecondsBeforeTheTicks) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(5));
    world.start();
    const auto operation = world.make();
    const auto busy = std::make_shared<std::atomic<unsigned>>(0);
    for (int worker = 0; worker < 4; ++worker) {
      world.platform.global.async([busy] {
        ++*busy;
        rt::sleepNs(60 * kSecond);
      });
    }
    EXPECT_TRUE(world.eventually([&] { return *busy == 4; }));
    const std::uint64_t start_ns = world.world.nowNs();
    EXPECT_EQ(world.run(*operation), resultOf({}, 0));
    EXPECT_EQ(world.world.nowNs() - start_ns, 10 * kSecond + 150 * kMs);
    EXPECT_TRUE(cache->calls().empty());
    // Late as it is, the answer is remembered.
    EXPECT_TRUE(world.eventually([&] { return world.remembered() == Dictionary{{"cache", 5}}; }));
  });
}

TEST(QueryWaits, ALateAnswerChangesNothingOfTheResultAndIsCountedByTheNextQuery) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto late = world.world.declareService("late", couldFree(5, kSecond));
    world.start();
    EXPECT_EQ(durationOf(world, {}, resultOf({}, 0)), 150 * kMs);
    rt::sleepNs(kSecond);
    EXPECT_EQ(durationOf(world, {}, resultOf({{"late", 5}}, 5)), 0U);
    EXPECT_EQ(late->callCount("servicePurgeable"), 1U);
  });
}

TEST(QueryWaits, ASilentServiceIsCountedFromMemoryUntilTheMemoryIsTwoMinutesOld) {
  inEverySchedule(10, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(5));
    world.start();
    world.query();
    cache->setBehaviour(answersQueries(sim::Answer::kNever));
    rt::sleepNs(119 * kSecond);
    EXPECT_EQ(world.query(), resultOf({{"cache", 5}}, 5));
    EXPECT_EQ(cache->callCount("servicePurgeable"), 1U);
    rt::sleepNs(2 * kSecond);
    EXPECT_EQ(world.query(), resultOf({}, 0));
    EXPECT_EQ(cache->callCount("servicePurgeable"), 2U);
  });
}

TEST(QueryWaits, FreeSpaceThatMovedByMoreThanFiveMebibytesMakesItAskAgain) {
  inEverySchedule(10, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(5));
    world.start();
    world.query();
    world.world.volumes().setFree("/", 5'242'880);
    world.query();
    EXPECT_EQ(cache->callCount("servicePurgeable"), 1U);
    world.world.volumes().setFree("/", 5'242'881);
    EXPECT_EQ(world.query(), resultOf({{"cache", 5}}, 5));
    EXPECT_EQ(cache->callCount("servicePurgeable"), 2U);
  });
}

TEST(QueryWaits, TheElapsedTimeIsLoggedInSecondsAndCountedInNanoseconds) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto slow = world.world.declareService("slow", couldFree(5, 30 * kMs));
    world.start();
    world.query();
    const auto& statistics = world.world.statistics();
    EXPECT_EQ(statistics.keys(), std::vector<std::string>{"slow_purgeableElapsedNanoseconds"});
    EXPECT_EQ(statistics.distribution("slow_purgeableElapsedNanoseconds"),
              std::vector<double>{30e6});
    EXPECT_TRUE(statistics.onlyTheDaemonsDomain());
    const auto took = world.filled("%s %@ took %f seconds, returned: %@");
    ASSERT_EQ(took.size(), 1U);
    EXPECT_EQ(took[0].rfind("startOperation slow took 0.030000 seconds, returned: {", 0), 0U);
    // The tick at which the answer is seen is that of 30 ms or the one after it.
    const auto elapsed = world.filled("%s elapsed time: %f result: %@");
    ASSERT_EQ(elapsed.size(), 1U);
    const std::string result =
        " result: {\"SPACEKEEP_TOTAL_AVAILABLE\": 5, \"SPACEKEEP_VOLUME\": \"/\", \"slow\": 5}";
    EXPECT_TRUE(elapsed[0] == "startOperation elapsed time: 0.030000" + result ||
                elapsed[0] == "startOperation elapsed time: 0.040000" + result)
        << elapsed[0];
  });
}

}  // namespace
}  // namespace spacekeep::test
