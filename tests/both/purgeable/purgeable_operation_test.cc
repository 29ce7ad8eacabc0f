// What a query consists of, apart from its times.
#include <gtest/gtest.h>

#include <algorithm>

#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

const Dictionary kPurges{{"SPACEKEEP_SERVICES", Array{"PURGE"}}};
const Dictionary kPeriodicOnly{{"SPACEKEEP_SERVICES", Array{"PERIODIC"}}};
const Dictionary kNotToBeQueried{{"SPACEKEEP_SERVICES", Array{"PURGE"}},
                                 {"SPACEKEEP_DO_NOT_QUERY", true}};

TEST(QueryConstruction, KeepsTheServicesThatPurgeAndMayBeQueried) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("asked", {}, kPurges);
    world.world.declareService("does not purge", {}, kPeriodicOnly);
    world.world.declareService("not to be queried", {}, kNotToBeQueried);
    world.start();
    const auto operation = world.make();
    ASSERT_EQ(operation->services().size(), 1U);
    EXPECT_TRUE(operation->services().contains("asked"));
    EXPECT_EQ(world.services().size(), 3U);
  });
}

TEST(QueryConstruction, ARequestThatTheBaseRefusesMakesNoOperation) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    EXPECT_EQ(world.make({{keys::kVolume, "/gone"}}), nullptr);
    EXPECT_EQ(world.make({{keys::kVolume, 1}}), nullptr);
  });
}

TEST(QueryCancel, DoesNothing) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", {});
    world.start();
    const auto operation = world.make();
    operation->updateInFlight("cache", true);
    EXPECT_TRUE(operation->implementsCancelOperation());
    operation->cancelOperation();
    EXPECT_EQ(operation->inFlightCount(), 1U);
    world.world.shutDown();
    EXPECT_TRUE(cache->calls().empty());
  });
}

TEST(Query, EveryServiceServedFromMemoryIsNotAskedAndTheResultIsMadeOfMemoryAlone) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto a = world.world.declareService("a", couldFree(1));
    const auto b = world.world.declareService("b", couldFree(2));
    world.start();
    SpacekeepRecentInfo memory = recordOf("/", "a", 100);
    memory.update("/", "b", {.amount = 200, .timestamp = recentDate(rt::wallClockNs())}, 0);
    world.remember(memory);
    EXPECT_EQ(world.query(), resultOf({{"a", 100}, {"b", 200}}, 300));
    EXPECT_TRUE(a->calls().empty());
    EXPECT_TRUE(b->calls().empty());
    EXPECT_EQ(world.lines("%s ^^^waiting for a little bit"), 0U);
    EXPECT_EQ(world.lines("%s ^^^done waiting, inFlight: %@"), 0U);
    EXPECT_EQ(world.lines("%s %s %@"), 0U);  // nobody was in flight
  });
}

TEST(Query, AServiceThatMayNotBeAskedIsStillCountedFromMemory) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto other = world.world.declareService("other", couldFree(1), kPeriodicOnly);
    const auto hidden = world.world.declareService("hidden", couldFree(2), kNotToBeQueried);
    world.start();
    EXPECT_EQ(world.query(), resultOf({}, 0));
    SpacekeepRecentInfo memory = recordOf("/", "other", 100);
    memory.update("/", "hidden", {.amount = 200, .timestamp = recentDate(rt::wallClockNs())}, 0);
    world.remember(memory);
    EXPECT_EQ(world.query(), resultOf({{"hidden", 200}, {"other", 100}}, 300));
    EXPECT_TRUE(other->calls().empty());
    EXPECT_TRUE(hidden->calls().empty());
  });
}

TEST(Query, AServiceThatIsAlreadyInFlightIsNotAskedAgain) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(1));
    world.start();
    const auto operation = world.make();
    operation->updateInFlight("cache", true);
    EXPECT_EQ(world.run(*operation), resultOf({}, 0));
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_TRUE(world.world.trace().hasLine(
        "updateInFlight trying to add \"cache\", which is already inFlight"));
    EXPECT_TRUE(world.world.trace().hasLine("startOperation Still in flight: [\"cache\"]"));
  });
}

TEST(Query, AServiceThatOptedOutOnTheSameOperationIsNotAsked) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", couldFree(1));
    world.start();
    const auto operation = world.make();
    EXPECT_FALSE(operation->optOutService("cache", true));
    EXPECT_EQ(world.run(*operation), resultOf({}, 0));
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.lines("%s ^^^waiting for a little bit"), 0U);
  });
}

TEST(Query, AnOptOutLivesNoLongerThanItsOperation) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    EXPECT_FALSE(world.make()->optOutService("cache", true));
    EXPECT_FALSE(world.make()->optOutService("cache", false));
    EXPECT_TRUE(world.daemon->optOuts().empty());
  });
}

TEST(Query, AmountsThatAreNoNumbersStayInTheItemsAndOutOfTheTotal) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    SpacekeepRecentInfo memory = recordOf("/", "number", 5);
    const Date now = recentDate(rt::wallClockNs());
    memory.update("/", "text", {.amount = "plenty", .timestamp = now}, 0);
    memory.update("/", "truth", {.amount = true, .timestamp = now}, 0);
    world.remember(memory);
    EXPECT_EQ(world.query(), resultOf({{"number", 5}, {"text", "plenty"}, {"truth", true}}, 5));
    EXPECT_EQ(world.problems(),
              (std::vector<std::string>{"startOperation 163 text num is not a number: plenty",
                                        "startOperation 163 truth num is not a number: true"}));
  });
}

TEST(Query, TheTotalIsSignedAndStaysAtTheEndsOfItsRange) {
  struct Case {
    Value one;
    Value two;
    std::int64_t total;
  };
  const Case cases[] = {{-5, 3, -2},
                        {UINT64_MAX, 0, INT64_MAX},
                        {INT64_MAX, 1, INT64_MAX},
                        {INT64_MIN, -1, INT64_MIN},
                        {0.9, 1.9, 1}};
  for (const Case& each : cases) {
    inEverySchedule(2, [&] {
      QueryWorld world;
      world.start();
      SpacekeepRecentInfo memory = recordOf("/", "one", each.one);
      memory.update("/", "two", {.amount = each.two, .timestamp = recentDate(rt::wallClockNs())},
                    0);
      world.remember(memory);
      EXPECT_EQ(*world.query().find("SPACEKEEP_TOTAL_AVAILABLE"), Value(each.total));
    });
  }
}

TEST(Query, AnotherVolumesMemoryIsNotCounted) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.volumes().add("/data", 1000, 0);
    world.start();
    SpacekeepRecentInfo memory = recordOf("/", "a", 5);
    memory.update("/data", "b", {.amount = 6, .timestamp = recentDate(rt::wallClockNs())}, 0);
    world.remember(memory);
    EXPECT_EQ(
        world.query({{keys::kVolume, "/data"}}),
        (Dictionary{{"SPACEKEEP_TOTAL_AVAILABLE", 6}, {"SPACEKEEP_VOLUME", "/data"}, {"b", 6}}));
  });
}

// Whatever the times are, the answer of everyone is in memory in the end.
TEST(Query, WhoeverAnswersIsInMemoryInTheEnd) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("a", couldFree(5));
    world.world.declareService("b", couldFree(6, 3 * kSecond));
    world.world.declareService("nothing", answersQueries(sim::Answer::kRepliesNothing));
    world.world.declareService("broken", answersQueries(sim::Answer::kFailsDuringCall));
    world.start();
    const Dictionary result = world.query();
    EXPECT_FALSE(result.contains(keys::kError));
    EXPECT_FALSE(result.contains("broken"));
    EXPECT_TRUE(world.eventually([&] {
      return world.remembered() == Dictionary{{"a", 5}, {"b", 6}, {"nothing", 0}};
    }));
  });
}

TEST(Query, ManyAtOnceOnOneDaemonEachGetTheirResult) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.start();
    world.remember(recordOf("/", "a", 5));
    std::vector<Dictionary> results(4);
    std::vector<rt::Thread> threads;
    for (Dictionary& result : results) {
      threads.emplace_back("query", [&world, &result] { result = world.query(); });
    }
    for (rt::Thread& thread : threads) thread.join();
    for (const Dictionary& result : results) EXPECT_EQ(result, resultOf({{"a", 5}}, 5));
  });
}

}  // namespace
}  // namespace spacekeep::test
