// The registry and its snapshots.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

TEST(ServiceRecord, StartsWithEverythingFalseOrAbsent) {
  const SKService service("cache");
  EXPECT_EQ(service.ID, "cache");
  EXPECT_FALSE(service.doesPurge());
  EXPECT_FALSE(service.doesPeriodic());
  EXPECT_FALSE(service.doNotQuery());
  EXPECT_EQ(service.desiredNotifications(), std::nullopt);
  EXPECT_EQ(service.endpoint(), nullptr);
  EXPECT_EQ(service.connection, nullptr);
}

TEST(ServiceRecord, DesiresOnlyTextsThatStandInAList) {
  inEverySchedule(kSchedules, [] {
    SKService service("cache");
    EXPECT_FALSE(service.desires("news"));
    service.setDesiredNotifications(Value("news"));
    EXPECT_FALSE(service.desires("news"));
    service.setDesiredNotifications(Value(Array{1, "news"}));
    EXPECT_TRUE(service.desires("news"));
    EXPECT_FALSE(service.desires("new"));
  });
}

TEST(Snapshots, OneTakenBeforeACheckInDoesNotHoldTheServiceOneTakenAfterDoes) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto before = world.daemon->copyServices();
    world.world.checkIn(world.world.addService("cache"), {{"PURGE", true}})->wait();
    const auto after = world.daemon->copyServices();
    EXPECT_FALSE(before->contains("cache"));
    EXPECT_TRUE(after->contains("cache"));
  });
}

TEST(Snapshots, ARemovedServiceStaysInSnapshotsTakenBefore) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto cache = world.world.addService("cache");
    world.world.checkIn(cache, {{"PURGE", true}})->wait();
    const auto snapshot = world.daemon->copyServices();
    cache->closeConnections();
    EXPECT_TRUE(world.eventually([&] { return world.services().empty(); }));
    EXPECT_TRUE(snapshot->contains("cache"));
  });
}

TEST(Snapshots, ChangingTheMutableCopyLeavesTheRegistryUnchanged) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("cache", {});
    world.start();
    ServiceMap copy = world.daemon->mutableServices();
    copy.erase("cache");
    copy["other"] = std::make_shared<SKService>("other");
    EXPECT_TRUE(world.services().contains("cache"));
    EXPECT_FALSE(world.services().contains("other"));
  });
}

TEST(Snapshots, ShareTheRecords) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("cache", {});
    world.start();
    const auto snapshot = world.daemon->copyServices();
    world.services().at("cache")->setDoesPeriodic(true);
    EXPECT_TRUE(snapshot->at("cache")->doesPeriodic());
  });
}

}  // namespace
}  // namespace spacekeep::test
