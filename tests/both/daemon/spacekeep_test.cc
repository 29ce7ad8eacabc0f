// The daemon object and its creation.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

TEST(DaemonObject, WithoutDescriptorDirectoriesStartsEmptyAndListens) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.files().remove("/System");
    world.start();
    EXPECT_TRUE(world.services().empty());
    EXPECT_TRUE(world.daemons().empty());
    EXPECT_TRUE(world.world.listener().resumed());
    EXPECT_NE(world.daemon->listener(), nullptr);
  });
}

TEST(DaemonObject, RequiresTheClientEntitlementFromItsPeers) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    EXPECT_EQ(world.world.listener().requiredEntitlement(), "CLIENT_ENTITLEMENT");
  });
}

TEST(DaemonObject, PurgeOperationsAndOperationsYieldNothing) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    bool is_absent = false;
    world.daemon->collection_queue()->sync(
        [&] { is_absent = !world.daemon->purgeOperations().has_value(); });
    EXPECT_TRUE(is_absent);
    EXPECT_EQ(world.daemon->operations(), std::nullopt);
  });
}

TEST(DaemonObject, HasSevenQueuesWithTheirLabels) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const Spacekeep& daemon = *world.daemon;
    EXPECT_EQ(daemon.purge_queue()->label(), "com.quorvel.spacekeep_purge");
    EXPECT_EQ(daemon.purgeable_queue()->label(), "com.quorvel.spacekeep_purgeable");
    EXPECT_EQ(daemon.periodic_queue()->label(), "com.quorvel.spacekeep_periodic");
    EXPECT_EQ(daemon.notify_queue()->label(), "com.quorvel.spacekeep_notify");
    EXPECT_EQ(daemon.daemons_queue()->label(), "com.quorvel.spacekeep_daemons");
    EXPECT_EQ(daemon.collection_queue()->label(), "com.quorvel.spacekeep_cancel");
    EXPECT_EQ(daemon.defaults_queue()->label(), "com.quorvel.spacekeep_defaults");
  });
}

TEST(DaemonObject, StartsWithItsBuiltInDefaultAndNoOptOuts) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    EXPECT_EQ(world.daemon->default_values(), (Dictionary{{"SPACEKEEP_CACHE_ENABLED", true}}));
    EXPECT_TRUE(world.daemon->optOuts().empty());
    EXPECT_EQ(world.daemon->rootPath(), "/");
  });
}

TEST(DaemonObject, WithoutAPreferencesSuiteSaysSoAndGoesOn) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.platform.openPreferencesSuite = [](const std::string& name) {
      EXPECT_EQ(name, "com.quorvel.spacekeep");
      return std::unique_ptr<PreferencesSuite>();
    };
    world.start();
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              std::vector<std::string>{"init Unable to initialize user defaults!"});
    EXPECT_TRUE(world.world.listener().resumed());
    PreferencesSuite* suite = nullptr;
    world.daemon->defaults_queue()->sync([&] { suite = world.daemon->userDefaults(); });
    EXPECT_EQ(suite, nullptr);
  });
}

TEST(DaemonObject, OpensTheSuiteOfItsName) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    PreferencesSuite* suite = nullptr;
    world.daemon->defaults_queue()->sync([&] { suite = world.daemon->userDefaults(); });
    EXPECT_NE(suite, nullptr);
  });
}

TEST(DaemonObject, LogsItsCreationInOrder) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto lines = world.world.trace().linesOfLevel(kLogTrace);
    EXPECT_EQ(lines, (std::vector<std::string>{
                         "init plistDir: //System/Library/Spacekeep/",
                         "init scanning //System/Library/Spacekeep/",
                         "init scanning /QuorvelInternal/Library/Spacekeep/",
                         "init resuming listener",
                     }));
  });
}

TEST(DaemonObject, LooksForTheFirstDescriptorsBelowItsRoot) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.files().addPlist("/elsewhere/System/Library/Spacekeep/a",
                                 Dictionary{{"SPACEKEEP_ID", "a"}});
    world.daemon = Spacekeep::create(world.platform, "/elsewhere");
    EXPECT_EQ(world.daemons(), std::set<std::string>{"a"});
  });
}

TEST(SharedSpacekeep, TwoFirstCallsAtOnceMakeOneObject) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    Spacekeep::setSharedPlatform(world.platform);
    std::shared_ptr<Spacekeep> first;
    std::shared_ptr<Spacekeep> second;
    rt::Thread one("one", [&] { first = Spacekeep::sharedSpacekeep(); });
    rt::Thread two("two", [&] { second = Spacekeep::sharedSpacekeep(); });
    one.join();
    two.join();
    EXPECT_NE(first, nullptr);
    EXPECT_EQ(first, second);
    EXPECT_EQ(Spacekeep::sharedSpacekeep(), first);
    EXPECT_EQ(world.lines("%s plistDir: %@"), 1U);
    world.world.shutDown();
    Spacekeep::resetSharedSpacekeep();
  });
}

}  // namespace
}  // namespace spacekeep::test
