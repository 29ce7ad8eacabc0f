#include "daemon/start_up.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <csignal>
#include <cstdlib>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// A started process: the main thread is parked on a thread of its own.
struct StartedWorld : DaemonWorld {
  StartedWorld() = default;
  ~StartedWorld() {
    world.events().unpark();
    if (main.joinable()) main.join();
    world.shutDown();
    Spacekeep::resetSharedSpacekeep();
  }
  void startProcess() {
    main = rt::Thread("main", [this] { startUp(platform, world.events(), world.keepAlive()); });
    EXPECT_TRUE(eventually([this] { return world.events().parked(); }));
  }
  rt::Thread main;
};

constexpr const char* kDaily = "com.quorvel.Spacekeep.daily";
constexpr const char* kStream = "com.quorvel.dispatch.vfs";

TEST(StartUp, RegistersEverySourceAnnouncesItselfAndParks) {
  inEverySchedule(kSchedules, [] {
    StartedWorld world;
    world.startProcess();
    EXPECT_EQ(world.world.events().registeredActivities(), std::vector<std::string>{kDaily});
    EXPECT_EQ(world.world.events().postedNotifications(),
              std::vector<std::string>{"com.quorvel.spacekeep.launched"});
    EXPECT_EQ(world.world.events().terminationHandler(), &sigterm_handler);
    EXPECT_TRUE(world.world.listener().resumed());
    EXPECT_EQ(world.world.keepAlive().begun(), 1U);
    EXPECT_EQ(world.world.keepAlive().open(), 0);
    EXPECT_TRUE(world.world.trace().hasLine("main Spacekeep, open for business!"));
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(StartUp, ALaunchThatCannotBeAnnouncedIsLoggedAndGoesOn) {
  inEverySchedule(kSchedules, [] {
    StartedWorld world;
    world.world.events().setNotificationResult(EACCES);
    world.startProcess();
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              std::vector<std::string>{
                  "main Failed to post the launched notification: Permission denied"});
    EXPECT_TRUE(world.world.trace().hasLine("main Spacekeep, open for business!"));
  });
}

TEST(StartUp, TheTimebaseGivesNanosecondsPerTick) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    setTimebaseConversion(rt::Timebase{.numerator = 125, .denominator = 3});
    EXPECT_DOUBLE_EQ(gTimebaseConversion, 125.0 / 3.0);
    EXPECT_TRUE(
        world.world.trace().hasLine("main timebaseInfo:  125 / 3, gTimebaseConversion: 41.666667"));
  });
}

TEST(StartUp, ReadsTheTimebaseOfTheMachine) {
  inEverySchedule(kSchedules, [] {
    StartedWorld world;
    gTimebaseConversion = 0.0;
    world.startProcess();
    EXPECT_EQ(gTimebaseConversion, 1.0);
    EXPECT_TRUE(
        world.world.trace().hasLine("main timebaseInfo:  1 / 1, gTimebaseConversion: 1.000000"));
  });
}

TEST(StartUp, WithoutATimebaseTheConversionStaysAsItIs) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    gTimebaseConversion = 0.0;
    setTimebaseConversion(std::nullopt);
    EXPECT_EQ(gTimebaseConversion, 0.0);
    EXPECT_EQ(world.lines("%s Failed to get timebase info\n"), 1U);
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem).size(), 1U);
  });
}

TEST(DailyActivity, InAnyStateButRunDoesNothingInsideItsTransaction) {
  for (const auto state : {ActivityState::kCheckIn, ActivityState::kWait, ActivityState::kDefer,
                           ActivityState::kContinue, ActivityState::kDone}) {
    inEverySchedule(kSchedules, [&] {
      StartedWorld world;
      sim::ServiceBehaviour silent;  // a pass that asks it lasts to the pass's limit
      silent.periodic.answer = sim::Answer::kNever;
      const auto purging = world.world.declareService("purging", silent);
      world.startProcess();
      const std::uint64_t before_ns = world.world.nowNs();
      ASSERT_TRUE(world.world.events().runActivity(kDaily, state));
      EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().begun() == 2; }));
      EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().open() == 0; }));
      if (!onRealThreads()) {
        EXPECT_LT(world.world.nowNs(), before_ns + 1'000'000'000);
      }
      EXPECT_EQ(purging->callCount("servicePeriodic"), 0U);
      EXPECT_EQ(world.lines("%s result: %@"), 0U);
      EXPECT_FALSE(world.world.keepAlive().wentNegative());
      EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
    });
  }
}

TEST(DailyActivity, WithoutLocalVolumesMakesNoCall) {
  inEverySchedule(kSchedules, [] {
    StartedWorld world;
    world.world.volumes().remove("/");
    world.startProcess();
    ASSERT_TRUE(world.world.events().runActivity(kDaily, ActivityState::kRun));
    EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().begun() == 2; }));
    EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().open() == 0; }));
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(FileSystemStream, AnEventIsHandledInsideATransaction) {
  inEverySchedule(kSchedules, [] {
    StartedWorld world;
    world.startProcess();
    ASSERT_TRUE(world.world.events().send(kStream, {{"_Flags", 4U}}));
    EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().begun() == 2; }));
    EXPECT_TRUE(world.eventually([&] { return world.world.keepAlive().open() == 0; }));
    EXPECT_FALSE(world.world.keepAlive().wentNegative());
  });
}

TEST(TerminationDeathTest, TheSignalExitsWithStatusZeroEvenWhileAPurgeIsInFlight) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  const auto signal_during_a_purge = [] {
    inEverySchedule(1, [] {
      StartedWorld world;
      sim::ServiceBehaviour never;
      never.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
      const auto silent = world.world.declareService("silent", never);
      world.startProcess();
      std::signal(SIGTERM, world.world.events().terminationHandler());
      rt::Thread purging("purging", [] {
        static_cast<void>(Spacekeep::sharedSpacekeep()->purge(
            Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 10}, {keys::kPurgeTimeout, 300}},
            nullptr));
      });
      if (!world.eventually([&] { return silent->callCount("servicePurge") == 1; })) std::abort();
      std::raise(SIGTERM);
      std::abort();
    });
  };
  EXPECT_EXIT(signal_during_a_purge(), ::testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace spacekeep::test
