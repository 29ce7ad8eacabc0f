// Queries of clients, from the call to the answer, on virtual time.
#include <gtest/gtest.h>

#include "tests/both/purgeable/query_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

constexpr const char* kPlain = "clientPurgeableSpace";
constexpr const char* kItemized = "clientItemizedPurgeableSpace";
const Dictionary kRoot{{keys::kVolume, "/"}};

std::shared_ptr<sim::SimulatedPeer> holderOf(QueryWorld& world, const char* entitlement) {
  return world.world.client(entitlement, {entitlement});
}

TEST(ClientQuery, BothKindsAreAnsweredWithTheWholeResult) {
  for (const auto& [member, entitlement] :
       {std::pair(kPlain, "PURGEABLE_ENTITLEMENT"),
        std::pair(kItemized, "ITEMIZED_PURGEABLE_ENTITLEMENT")}) {
    inEverySchedule(kSchedules, [&, member = member, entitlement = entitlement] {
      QueryWorld world;
      world.world.declareService("a", couldFree(5));
      world.world.declareService("b", couldFree(6));
      world.start();
      const auto call = world.world.call(holderOf(world, entitlement), member, {kRoot});
      EXPECT_EQ(call->wait(), resultOf({{"a", 5}, {"b", 6}}, 11));
      EXPECT_EQ(call->answers(), 1U);
      EXPECT_TRUE(world.problems().empty());
    });
  }
}

TEST(QueryDispatch, TwoAtOnceRunOneAfterTheOtherAndEachGetsItsOwnOutcome) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.volumes().add("/data", 1000, 0);
    sim::ServiceBehaviour behaviour = couldFree(5, 45 * kMs);
    behaviour.owns.merge(sim::ownsBytes("/data", 6).owns);
    const auto cache = world.world.declareService("cache", behaviour);
    world.start();
    const auto peer = holderOf(world, "PURGEABLE_ENTITLEMENT");
    const auto root = world.world.call(peer, kPlain, {kRoot});
    const auto data = world.world.call(peer, kPlain, {Dictionary{{keys::kVolume, "/data"}}});
    EXPECT_EQ(root->wait(), resultOf({{"cache", 5}}, 5));
    EXPECT_EQ(data->wait(),
              (Dictionary{
                  {"SPACEKEEP_TOTAL_AVAILABLE", 6}, {"SPACEKEEP_VOLUME", "/data"}, {"cache", 6}}));
    // The second one asks when the first one has ended, at its fifth tick.
    const auto calls = cache->callsOf("servicePurgeable");
    ASSERT_EQ(calls.size(), 2U);
    EXPECT_EQ(calls[1].arrived_ns - calls[0].arrived_ns, 50 * kMs);
  });
}

TEST(QueryDispatch, AQueryDoesNotWaitForAPurge) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    sim::ServiceBehaviour behaviour = couldFree(5);
    behaviour.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    const auto cache = world.world.declareService("cache", behaviour);
    world.start();
    const auto purge = world.world.call(
        holderOf(world, "PURGE_ENTITLEMENT"), "clientPurge",
        {Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 5}, {keys::kUrgency, 1}}});
    EXPECT_TRUE(world.eventually([&] { return cache->callCount("servicePurge") == 1; }));
    const auto query = world.world.call(holderOf(world, "PURGEABLE_ENTITLEMENT"), kPlain, {kRoot});
    EXPECT_EQ(query->wait(), resultOf({{"cache", 5}}, 5));
    EXPECT_EQ(purge->state(), CallState::kOpen);
    purge->wait();
  });
}

TEST(QueryDispatch, AServiceThatChecksInDuringAQueryIsNotPartOfIt) {
  inEverySchedule(kSchedules, [] {
    QueryWorld world;
    world.world.declareService("slow", couldFree(5, 100 * kMs));
    world.start();
    const auto query = world.world.call(holderOf(world, "PURGEABLE_ENTITLEMENT"), kPlain, {kRoot});
    rt::sleepNs(20 * kMs);
    const auto late = world.world.addService("late", couldFree(6));
    world.world.checkIn(late, {{"PURGE", true}})->wait();
    EXPECT_EQ(query->wait(), resultOf({{"slow", 5}}, 5));
    EXPECT_EQ(late->callCount("servicePurgeable"), 0U);
    EXPECT_EQ(world.daemon->totalAvailable(kRoot), resultOf({{"late", 6}, {"slow", 5}}, 11));
  });
}

}  // namespace
}  // namespace spacekeep::test
