// A service that does not answer its ping holds the registry for as long as it stays silent.
#include <gtest/gtest.h>

#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;

TEST(SilentService, HoldsSnapshotsAndCheckInsUntilItAnswersItsPing) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    sim::ServiceBehaviour slow;
    slow.ping.delay_ns = 100 * kSecond;
    const auto silent = world.world.addService("silent", slow);
    const auto first = world.world.checkIn(silent, {{"PURGE", true}});
    EXPECT_TRUE(world.eventually([&] { return silent->callCount("servicePing") == 1; }));
    const auto second = world.world.checkIn(world.world.addService("quick"), {{"PURGE", true}});
    EXPECT_GE(world.services().size(), 1U);
    EXPECT_GE(world.world.nowNs(), 100 * kSecond);
    first->wait();
    second->wait();
    EXPECT_GE(first->answeredNs(), 100 * kSecond);
    EXPECT_GE(second->answeredNs(), 100 * kSecond);
    EXPECT_EQ(world.services().size(), 2U);
  });
}

// The wait has no limit and the failure of the call does not end it: the removal that the end of
// the connection asks for stands behind it as well.
TEST(SilentService, WhoseConnectionEndsDuringThePingHoldsTheRegistryForGood) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    sim::ServiceBehaviour never;
    never.ping.answer = sim::Answer::kNever;
    const auto silent = world.world.addService("silent", never);
    const auto call = world.world.checkIn(silent, {{"PURGE", true}});
    EXPECT_TRUE(world.eventually([&] { return silent->callCount("servicePing") == 1; }));
    silent->closeConnections();
    EXPECT_TRUE(world.eventually([&] {
      return world.world.trace().hasLine("clientCheckin invalidationHandler ENTRY") &&
             world.lines("%s failed to get the remote proxy: %@") == 1;
    }));
    EXPECT_FALSE(call->waitForNs(1000 * kSecond));
  });
}

}  // namespace
}  // namespace spacekeep::test
