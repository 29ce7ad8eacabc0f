// The fields of the daemon object that may be set: what is set is what is read.
#include <gtest/gtest.h>

#include "sim/world/in_memory_preferences.h"
#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

class IdleListener final : public ipc::Listener {
 public:
  void setRequiredEntitlement(std::string) override {}
  void resume() override {}
};

class OperationWithoutCancel final : public OperationInterface {
 public:
  void startOperation(OperationCompletion) override {}
  void cancelOperation() override { ++cancels; }

  int cancels = 0;
};

TEST(DaemonFields, ADaemonSetCanBeReplacedOnItsQueue) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    world.daemon->daemons_queue()->sync([&] { world.daemon->setDaemons({"a", "b"}); });
    EXPECT_EQ(world.daemons(), (std::set<std::string>{"a", "b"}));
  });
}

TEST(DaemonFields, AnotherSuiteIsWhatClientStateIsReadFromFromThenOn) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::InMemoryDisk disk;
    disk.write("other", {{"SPACEKEEP_USER_DEFAULTS", Dictionary{{"KEY", "from the other"}}}});
    world.start();
    world.daemon->defaults_queue()->sync([&] {
      world.daemon->setUserDefaults(std::make_unique<sim::InMemoryPreferencesSuite>(disk, "other"));
      EXPECT_NE(world.daemon->userDefaults(), nullptr);
    });
    ipc::OptionalValue read;
    world.daemon->defaults_queue()->sync([&] {
      world.daemon->_clientGetState("KEY", [&](ipc::OptionalValue value) { read = value; });
    });
    EXPECT_EQ(read, Value("from the other"));
    world.daemon->defaults_queue()->sync([&] { world.daemon->setUserDefaults(nullptr); });
  });
}

TEST(DaemonFields, WhatTheDaemonNeverUsesKeepsWhatWasSet) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    Spacekeep& daemon = *world.daemon;
    EXPECT_EQ(daemon.operations(), std::nullopt);
    EXPECT_EQ(daemon.optOuts(), Dictionary());
    EXPECT_EQ(daemon.rootPath(), "/");
    EXPECT_EQ(daemon.default_values(), (Dictionary{{"SPACEKEEP_CACHE_ENABLED", true}}));
    daemon.setOperations(Array{1});
    daemon.setOptOuts({{"cache", true}});
    daemon.setDefault_values({{"KEY", 2}});
    EXPECT_EQ(daemon.operations(), Array{1});
    EXPECT_EQ(daemon.optOuts(), (Dictionary{{"cache", true}}));
    EXPECT_EQ(daemon.default_values(), (Dictionary{{"KEY", 2}}));
  });
}

TEST(DaemonFields, ARunningOperationThatCannotBeCancelledIsFoundAndLeftAlone) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto operation = std::make_shared<OperationWithoutCancel>();
    PurgeOperations running;
    running.set("token", operation);
    world.daemon->collection_queue()->sync([&] { world.daemon->setPurgeOperations(running); });
    EXPECT_FALSE(operation->implementsCancelOperation());
    world.daemon->clientCancelPurge({{keys::kToken, "token"}}, nullptr);
    EXPECT_EQ(operation->cancels, 0);
  });
}

TEST(DaemonFields, TheListenerCanBeReplaced) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    EXPECT_NE(world.daemon->listener(), nullptr);
    auto listener = std::make_unique<IdleListener>();
    const IdleListener* const replacement = listener.get();
    world.daemon->setListener(std::move(listener));
    EXPECT_EQ(world.daemon->listener(), replacement);
  });
}

}  // namespace
}  // namespace spacekeep::test
