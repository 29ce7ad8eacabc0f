// The daily pass from its activity to the services, on virtual time.
#include <gtest/gtest.h>

#include "daemon/start_up.h"
#include "tests/both/operations/periodic_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr const char* kDaily = "com.quorvel.Spacekeep.daily";

struct DailyWorld : PeriodicWorld {
  ~DailyWorld() {
    world.events().unpark();
    if (main.joinable()) main.join();
    world.shutDown();
    Spacekeep::resetSharedSpacekeep();
  }
  void startProcess() {
    main = rt::Thread("main", [this] { startUp(platform, world.events(), world.keepAlive()); });
    EXPECT_TRUE(eventually([this] { return world.events().parked(); }));
  }
  /// Runs the activity and answers how long it took.
  std::uint64_t runDaily() {
    const std::uint64_t start_ns = world.nowNs();
    EXPECT_TRUE(world.events().runActivity(kDaily, ActivityState::kRun));
    EXPECT_TRUE(eventually([this] { return world.keepAlive().begun() == 2; }));
    EXPECT_TRUE(eventually([this] { return world.keepAlive().open() == 0; }));
    return world.nowNs() - start_ns;
  }
  rt::Thread main;
};

TEST(DailyPass, VisitsEveryLocalVolumeOneAfterTheOtherInMountOrder) {
  inEverySchedule(kSchedules, [] {
    DailyWorld world;
    world.world.volumes().add("/z", 1000, 0);
    world.world.volumes().add("/a", 1000, 0);
    const auto cache = world.add("cache", 7, kSecond);
    world.startProcess();
    world.runDaily();
    const auto calls = cache->callsOf("servicePeriodic");
    ASSERT_EQ(calls.size(), 3U);
    const char* const volumes[] = {"/", "/z", "/a"};
    for (std::size_t i = 0; i < calls.size(); ++i) {
      EXPECT_EQ(calls[i].info, (Dictionary{{keys::kVolume, volumes[i]}}));
      EXPECT_EQ(calls[i].arrived_ns - calls[0].arrived_ns, i * kSecond);
    }
    EXPECT_EQ(
        world.world.trace().linesWithFormat("%s result: %@"),
        std::vector<std::string>(3, "performPeriodicsWithInfo result: {\"SPACEKEEP_AMOUNT\": 7}"));
  });
}

TEST(DailyPass, IsOneKeepAliveTransactionForAllItsFifteenSeconds) {
  inEverySchedule(kSchedules, [] {
    DailyWorld world;
    world.world.volumes().add("/data", 1000, 0);
    world.startProcess();
    EXPECT_GE(world.runDaily(), 30 * kSecond);
    EXPECT_LT(world.world.nowNs(), 31 * kSecond);
    EXPECT_FALSE(world.world.keepAlive().wentNegative());
  });
}

}  // namespace
}  // namespace spacekeep::test
