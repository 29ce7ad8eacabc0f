// What the daily pass over one volume consists of, apart from its times.
#include <gtest/gtest.h>

#include "tests/both/operations/periodic_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

TEST(Periodic, AServiceWithPeriodicWorkOfItsOwnIsLeftOutAndOneThatOnlyPurgesIsAsked) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    const auto both = world.add("both", 1, 0, Array{"PURGE", "PERIODIC"});
    const auto purges = world.add("purges", 1, 0, Array{"PURGE"});
    world.start();
    const auto operation = world.make();
    ASSERT_EQ(operation->services().size(), 1U);
    EXPECT_TRUE(operation->services().contains("purges"));
    world.run(*operation);
    EXPECT_TRUE(world.eventually([&] { return purges->callCount("servicePeriodic") == 1; }));
    world.world.shutDown();
    EXPECT_EQ(purges->calls().size(), 1U);
    EXPECT_TRUE(both->calls().empty());
  });
}

TEST(Periodic, AServiceThatDoesNotPurgeIsNeverAsked) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    const auto periodic = world.add("periodic", 1, 0, Array{"PERIODIC"});
    const auto neither = world.add("neither", 1, 0, Array{});
    world.start();
    const auto operation = world.make();
    EXPECT_TRUE(operation->services().empty());
    EXPECT_EQ(world.run(*operation), amountOf(0));
    EXPECT_TRUE(periodic->calls().empty());
    EXPECT_TRUE(neither->calls().empty());
  });
}

TEST(Periodic, AServiceThatMayNotBeQueriedTakesPart) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.world.declareService(
        "hidden", {}, {{"SPACEKEEP_SERVICES", Array{"PURGE"}}, {"SPACEKEEP_DO_NOT_QUERY", true}});
    world.start();
    EXPECT_TRUE(world.make()->services().contains("hidden"));
  });
}

TEST(Periodic, TheUrgencyIsThreeWhateverTheRequestSaysAndTheRequestGoesAlong) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    const auto cache = world.add("cache", 1, 0);
    world.start();
    const Dictionary request{{keys::kVolume, "/"}, {keys::kUrgency, 1}, {"MINE", "x"}};
    world.run(*world.make(request));
    EXPECT_TRUE(world.eventually([&] { return cache->callCount("servicePeriodic") == 1; }));
    EXPECT_EQ(cache->callsOf("servicePeriodic").front().urgency, 3);
    EXPECT_EQ(cache->callsOf("servicePeriodic").front().info, request);
  });
}

TEST(Periodic, ARequestThatTheBaseRefusesMakesNoOperation) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    world.start();
    EXPECT_EQ(world.make({{keys::kVolume, "/gone"}}), nullptr);
  });
}

TEST(Periodic, ARefusedPassAsksNobodyAndLogsNoResult) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    const auto cache = world.add("cache", 1, 0);
    world.start();
    world.daemon->performPeriodicsWithInfo(Dictionary{{keys::kVolume, "/gone"}});
    world.daemon->performPeriodicsWithInfo(Value("no dictionary"));
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.lines("%s result: %@"), 0U);
  });
}

TEST(Periodic, IsCancelledAsTheBaseIs) {
  inEverySchedule(kSchedules, [] {
    PeriodicWorld world;
    const auto cache = world.add("cache", 1, 0);
    world.start();
    const auto operation = world.make();
    operation->updateInFlight("cache", true);
    EXPECT_TRUE(operation->implementsCancelOperation());
    operation->cancelOperation();
    EXPECT_TRUE(world.eventually([&] { return cache->callCount("serviceCancelPurge") == 1; }));
  });
}

}  // namespace
}  // namespace spacekeep::test
