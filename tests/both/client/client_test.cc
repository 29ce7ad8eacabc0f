// What clients ask for and what they get.
#include <gtest/gtest.h>

#include "client/client_adaptor.h"
#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

/// A purge that ends without waiting out a deadline.
Dictionary purgeRequest(std::uint64_t amount_bytes) {
  return {{keys::kVolume, "/"},
          {keys::kAmount, amount_bytes},
          {keys::kUrgency, 1},
          {keys::kPurgeTimeout, 300},
          {keys::kFinishEarly, true}};
}

std::shared_ptr<sim::SimulatedPeer> purger(DaemonWorld& world) {
  return world.world.client("purger", {"PURGE_ENTITLEMENT"});
}

TEST(ClientPurge, IsAnsweredWithTheOutcome) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.world.declareService("cache", sim::ownsBytes("/", 5000));
    world.start();
    const auto call = world.world.call(purger(world), "clientPurge", {purgeRequest(1000)});
    const auto outcome = call->wait();
    ASSERT_TRUE(outcome.has_value());
    EXPECT_EQ(unsignedAt(*outcome, keys::kAmount), 1000U);
    EXPECT_EQ(call->answers(), 1U);
  });
}

TEST(ClientPurge, WithoutTheEntitlementMakesNoOperationAndIsAnsweredWithNothing) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    const auto cache = world.world.declareService("cache", sim::ownsBytes("/", 5000));
    world.start();
    const auto client = world.world.client(
        "other",
        {"PURGEABLE_ENTITLEMENT", "ITEMIZED_PURGEABLE_ENTITLEMENT", "SERVICE_ENTITLEMENT"});
    const auto call = world.world.call(client, "clientPurge", {purgeRequest(1000)});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kAnswered);
    EXPECT_TRUE(cache->calls().empty());
    EXPECT_EQ(world.lines("%s user_timeout_seconds: %llu"), 0U);
    EXPECT_EQ(world.world.trace().linesOfLevel(kLogProblem),
              std::vector<std::string>{"clientPurge Connection is not entitled!"});
  });
}

TEST(ClientPurge, ThatTheOperationRefusesIsAnsweredWithNothing) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto call =
        world.world.call(purger(world), "clientPurge", {Dictionary{{keys::kAmount, 1}}});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kAnswered);
  });
}

TEST(ClientPurge, OfAnAmountThatIsNoNumberIsAnsweredWithTheError) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto call =
        world.world.call(purger(world), "clientPurge", {Dictionary{{keys::kVolume, "/"}}});
    EXPECT_EQ(call->wait(),
              (Dictionary{{keys::kError, "Parameter error, no Amount key in info dict"}}));
  });
}

TEST(ClientPurge, RepliesOnAnotherThreadThanTheServingOneAlsoToWhoMayPurge) {
  for (const bool may_purge : {false, true}) {
    inEverySchedule(kSchedules, [may_purge] {
      DaemonWorld world;
      world.start();
      struct Seen {
        std::atomic<bool> inside = true;
        std::atomic<bool> replied = false;
      };
      const auto seen = std::make_shared<Seen>();
      // The mark is in the serving thread's own storage: the reply must not see it.
      const auto peer = may_purge ? purger(world) : world.world.client("nobody");
      const ipc::ServingScope scope(peer.get());
      world.daemon->clientPurge(purgeRequest(0),
                                [seen, may_purge](const ipc::OptionalDictionary& answer) {
                                  EXPECT_EQ(answer.has_value(), may_purge);
                                  seen->inside = ipc::currentConnection() != nullptr;
                                  seen->replied = true;
                                });
      EXPECT_TRUE(world.eventually([&] { return seen->replied.load(); }));
      EXPECT_FALSE(seen->inside);
    });
  }
}

TEST(ClientCancelPurge, IsAnsweredWithoutAnyEntitlement) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto call = world.world.call(world.world.client("nobody"), "clientCancelPurge",
                                       {Dictionary{{keys::kToken, "mine"}}});
    call->wait();
    EXPECT_EQ(call->state(), CallState::kAnswered);
    EXPECT_TRUE(call->answer().empty());
  });
}

TEST(ClientCancelPurge, RepliesOnTheServingThreadBeforeItReturns) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto peer = world.world.client("nobody");
    const ipc::ServingScope scope(peer.get());
    const ipc::PeerConnection* replied_on = nullptr;
    unsigned replies = 0;
    world.daemon->clientCancelPurge({{keys::kToken, "mine"}}, [&] {
      replied_on = ipc::currentConnection();
      ++replies;
    });
    EXPECT_EQ(replies, 1U);
    EXPECT_EQ(replied_on, peer.get());
  });
}

TEST(ClientCancelPurge, WithoutAReplyLooksUpAndReturns) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    world.daemon->clientCancelPurge({{keys::kToken, "mine"}}, nullptr);
    world.daemon->clientCancelPurge({}, nullptr);
    EXPECT_TRUE(world.world.trace().linesOfLevel(kLogProblem).empty());
  });
}

TEST(ClientCancelPurge, DoesNotStopTheRunningPurgeOfThatTokenAndIsAnswered) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 5000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    const auto cache = world.world.declareService("cache", held);
    world.start();
    Dictionary request = purgeRequest(1000);
    request.set(keys::kToken, "mine");
    const auto purge = world.world.call(purger(world), "clientPurge", {request});
    EXPECT_TRUE(world.eventually([&] { return cache->callCount("servicePurge") == 1; }));
    const auto cancel = world.world.call(world.world.client("other"), "clientCancelPurge",
                                         {Dictionary{{keys::kToken, "mine"}}});
    cancel->wait();
    EXPECT_EQ(cancel->state(), CallState::kAnswered);
    cache->answerHeldCalls();
    const auto outcome = purge->wait();
    ASSERT_TRUE(outcome.has_value());
    EXPECT_FALSE(outcome->contains(keys::kOperationCancelled));
    EXPECT_EQ(unsignedAt(*outcome, keys::kAmount), 1000U);
    EXPECT_EQ(cache->callCount("serviceCancelPurge"), 0U);
  });
}

TEST(ClientAdaptor, ServesEveryDescribedMethodInOrderAndInItsLane) {
  const ipc::ServedInterface served = makeClientAdaptor({});
  ASSERT_EQ(served.description, &spacekeepClientInterface());
  ASSERT_EQ(served.methods.size(), served.description->methods.size());
  for (std::size_t i = 0; i < served.methods.size(); ++i) {
    EXPECT_EQ(served.methods[i].name, served.description->methods[i].name);
  }
  EXPECT_EQ(served.methods[0].mode, ipc::ServeMode::kInOrder);
  EXPECT_EQ(served.methods[3].lane, "purge");
  EXPECT_EQ(served.methods[3].lane_width, 64U);
  EXPECT_EQ(served.methods[4].lane, "cancel");
  EXPECT_EQ(served.methods[4].lane_width, 16U);
}

TEST(ClientAdaptor, StateCallsOfOneUserTakeTurnsAndNoOthers) {
  for (const ipc::ServedMethod& method : makeClientAdaptor({}).methods) {
    const bool is_of_state = method.name == "clientSetState" || method.name == "clientGetState";
    EXPECT_EQ(method.turn_per_user, is_of_state) << method.name;
  }
}

TEST(ClientAdaptor, WithoutItsObjectFailsTheCall) {
  const ipc::ServedInterface served = makeClientAdaptor({});
  std::string error_name;
  served.methods[4].serve({Dictionary{}},
                          {.reply = [](const ipc::Arguments&) { FAIL(); },
                           .fail = [&](const ipc::Error& error) { error_name = error.name; }});
  EXPECT_EQ(error_name, "org.freedesktop.DBus.Error.UnknownObject");
}

TEST(Interfaces, HaveTheirOperationsInOrder) {
  std::vector<std::string_view> client;
  for (const auto& method : spacekeepClientInterface().methods) client.push_back(method.name);
  EXPECT_EQ(client, (std::vector<std::string_view>{
                        "clientCheckin", "clientPurgeableSpace", "clientItemizedPurgeableSpace",
                        "clientPurge", "clientCancelPurge", "clientSetState", "clientGetState"}));
  std::vector<std::string_view> service;
  for (const auto& method : spacekeepServiceInterface().methods) service.push_back(method.name);
  EXPECT_EQ(service, (std::vector<std::string_view>{
                         "servicePurgeable", "servicePurge", "servicePeriodic",
                         "serviceCancelPurge", "servicePing", "serviceNotify", "serviceCallback"}));
}

}  // namespace
}  // namespace spacekeep::test
