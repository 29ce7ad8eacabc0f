// Queries that count from memory only what was answered for their own urgency.
#include <gtest/gtest.h>

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

TEST(ExactUrgency, EachUrgencyIsAskedForAndRememberedByItself) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    const auto cache = world.world.declareService("cache", givesMoreAtThree());
    world.start();
    EXPECT_EQ(world.query(exactly(1)), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.query(exactly(3)), resultOf({{"cache", 11}}, 11));
    EXPECT_EQ(cache->calls().size(), 2U);
    EXPECT_EQ(world.query(exactly(1)), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.query(exactly(3)), resultOf({{"cache", 11}}, 11));
    EXPECT_EQ(cache->calls().size(), 2U);
  });
}

TEST(ExactUrgency, OtherQueriesNeitherSeeItsAnswersNorGiveItTheirs) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    static_cast<void>(world.query(exactly(1)));
    EXPECT_EQ(world.record(), std::nullopt);
    EXPECT_EQ(world.query(), resultOf({{"cache", 11}}, 11));
    EXPECT_EQ(world.query(exactly(2)), resultOf({{"cache", 1}}, 1));
    EXPECT_EQ(world.remembered(), (Dictionary{{"cache", 11}}));
  });
}

TEST(ExactUrgency, TheMemoryStandsInTheStateUnderTheUrgency) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    static_cast<void>(world.query(exactly(4)));
    const auto record = world.recordAt("SPACEKEEP_RECENT_SERVICE_STATS_URGENCY_4");
    ASSERT_TRUE(record.has_value());
    EXPECT_EQ(record->volume("/")->services.at("cache").amount, Value(11));
    EXPECT_EQ(world.recordAt("SPACEKEEP_RECENT_SERVICE_STATS_URGENCY_3"), std::nullopt);
  });
}

TEST(ExactUrgency, FalseIsAsIfItWereNotThere) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("cache", givesMoreAtThree());
    world.start();
    static_cast<void>(world.query({{keys::kUrgency, 1}, {keys::kExactUrgency, false}}));
    EXPECT_EQ(world.remembered(), (Dictionary{{"cache", 1}}));
    EXPECT_EQ(world.query(), resultOf({{"cache", 1}}, 1));
  });
}

}  // namespace
}  // namespace spacekeep::test
