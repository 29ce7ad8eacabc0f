// Queries that count from memory only what was answered for their own urgency.
#include <gtest/gtest.h>

#include "support/values/text.h"
#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

Dictionary exactly(std::int32_t urgency) {
  return {{keys::kUrgency, urgency}, {keys::kExactUrgency, true}};
}

/// Gives up 1 byte at urgency 1, and 10 more at urgency 3.
sim::ServiceBehaviour givesMoreAtThree() {
  sim::ServiceBehaviour behaviour;
  behaviour.owns["/"] = {0, 1, 0, 10, 0};
  return behaviour;
}

/// Queries until the answer is `expected`: on real threads a busy machine may miss the 150 ms of a
/// query, and what the service says then is in the answer of a later one.
void expectInTheEnd(QueryWorld& world, const Dictionary& info, const Dictionary& expected) {
  Dictionary last;
  const bool came = world.eventually([&] { return (last = world.query(info)) == expected; });
  EXPECT_TRUE(came) << "the last answer was " << textOf(last);
}

TEST(ExactUrgency, EachUrgencyIsAskedForAndRememberedByItself) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", givesMoreAtThree());
    world.start();
    expectInTheEnd(world, exactly(1), resultOf({{"cache", 1}}, 1));
    expectInTheEnd(world, exactly(3), resultOf({{"cache", 11}}, 11));
    const std::size_t asked = cache->calls().size();
    EXPECT_TRUE(asked == 2 || onRealThreads()) << asked;
    EXPECT_EQ(world.query(exactly(1)), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.query(exactly(3)), resultOf({{"cache", 11}}, 11));
    EXPECT_EQ(cache->calls().size(), asked);
  });
}

TEST(ExactUrgency, OtherQueriesNeitherSeeItsAnswersNorGiveItTheirs) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    expectInTheEnd(world, exactly(1), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.record(), std::nullopt);
    expectInTheEnd(world, {}, resultOf({{"cache", 11}}, 11));
    expectInTheEnd(world, exactly(2), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.remembered(), (Dictionary{{"cache", 11}}));
  });
}

TEST(ExactUrgency, TheMemoryStandsInTheStateUnderTheUrgency) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    expectInTheEnd(world, exactly(4), resultOf({{"cache", 11}}, 11));
    const auto entry = [&world] {
      return world.recordAt("SPACEKEEP_RECENT_SERVICE_STATS_URGENCY_4");
    };
    ASSERT_TRUE(world.eventually([&] { return entry().has_value(); }));
    EXPECT_EQ(entry()->volume("/")->services.at("cache").amount, Value(11));
    EXPECT_EQ(world.recordAt("SPACEKEEP_RECENT_SERVICE_STATS_URGENCY_3"), std::nullopt);
  });
}

TEST(ExactUrgency, FalseIsAsIfItWereNotThere) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    expectInTheEnd(world, {{keys::kUrgency, 1}, {keys::kExactUrgency, false}},
                   resultOf({{"cache", 1}}, 1));
    EXPECT_TRUE(world.eventually([&] { return world.remembered() == Dictionary{{"cache", 1}}; }));
    EXPECT_EQ(world.query(), resultOf({{"cache", 1}}, 1));
  });
}

}  // namespace
}  // namespace spacekeep::test
