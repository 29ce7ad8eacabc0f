// The simulated listener serves as ServeMode promises.
#include <gtest/gtest.h>

#include <atomic>
#include <vector>

#include "sim/world/world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr unsigned kSchedules = 40;

const ipc::InterfaceDescription& testInterface() {
  static const ipc::InterfaceDescription interface {
    "test", {
      {"quick", {{"number", ipc::ArgumentKind::kInt32}}, {}}, {"slow", {}, {}}, {"lost", {}, {}}, {
        "twice", {}, {
          { "answer", ipc::ArgumentKind::kOptionalDictionary }
        }
      }
    }
  };
  return interface;
}

struct Served {
  std::vector<std::int32_t> order;  // touched by one task at a time: that is what is tested
  std::atomic<int> running = 0;
  std::atomic<int> peak = 0;
  std::atomic<bool> saw_right_peer = true;
};

ipc::ServedInterface serving(Served& served) {
  ipc::ServedInterface interface;
  interface.description = &testInterface();
  interface.methods = {
      {.name = "quick",
       .lane = {},
       .serve =
           [&served](ipc::Arguments in, ipc::Responder responder) {
             served.order.push_back(std::get<std::int32_t>(in.at(0)));
             responder.reply({});
           }},
      {.name = "slow",
       .mode = ipc::ServeMode::kLane,
       .lane = "slow",
       .lane_width = 3,
       .serve =
           [&served](const ipc::Arguments&, ipc::Responder responder) {
             const auto* peer = dynamic_cast<SimulatedPeer*>(ipc::currentConnection());
             if (peer == nullptr || peer->name() != "client") served.saw_right_peer = false;
             const int running = ++served.running;
             int peak = served.peak;
             while (running > peak && !served.peak.compare_exchange_weak(peak, running)) {
             }
             CountingSemaphore(0).waitForNs(kSecond) == WaitResult::kTimedOut
                 ? responder.reply({})
                 : responder.fail({"", ""});
             --served.running;
           }},
      {.name = "lost", .lane = {}, .serve = [](const ipc::Arguments&, const ipc::Responder&) {}},
      {.name = "twice",
       .lane = {},
       .serve =
           [](const ipc::Arguments&, const ipc::Responder& responder) {
             responder.reply({ipc::OptionalDictionary(Dictionary{{"n", 1}})});
             responder.reply({ipc::OptionalDictionary(Dictionary{{"n", 2}})});
           }},
  };
  return interface;
}

TEST(SimulatedListener, RefusesWhoLacksTheEntitlementAndEverybodyBeforeResume) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->setRequiredEntitlement("KEY");
    const auto holder = world.client("holder", {"KEY"});
    const auto other = world.client("other");
    EXPECT_EQ(world.call(holder, "quick", {1})->state(), ClientCall::State::kFailed);
    listener->resume();
    EXPECT_EQ(world.call(other, "quick", {1})->state(), ClientCall::State::kFailed);
    const auto call = world.call(holder, "quick", {2});
    (void)call->wait();
    EXPECT_EQ(call->state(), ClientCall::State::kAnswered);
    EXPECT_EQ(served.order, std::vector<std::int32_t>{2});
    world.shutDown();
  });
}

TEST(SimulatedListener, CallsThatOnlyEnqueueRunInTheOrderInWhichTheyCame) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->resume();
    const auto client = world.client("client");
    std::shared_ptr<ClientCall> last;
    for (std::int32_t number = 0; number < 6; ++number) {
      last = world.call(client, "quick", {number});
    }
    (void)last->wait();
    EXPECT_EQ(served.order, (std::vector<std::int32_t>{0, 1, 2, 3, 4, 5}));
    world.shutDown();
  });
}

TEST(SimulatedListener, ALaneRunsAsManyAsItIsWideAndTheRestWaits) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->resume();
    const auto client = world.client("client");
    std::vector<std::shared_ptr<ClientCall>> calls;
    for (int i = 0; i < 7; ++i) calls.push_back(world.call(client, "slow", {}));
    for (const auto& call : calls) (void)call->wait();
    EXPECT_EQ(served.peak, 3);
    EXPECT_EQ(world.nowNs(), 3 * kSecond);  // seven calls of a second each, three at a time
    EXPECT_TRUE(served.saw_right_peer);
    world.shutDown();
  });
}

TEST(SimulatedListener, TellsACallThatIsNeverAnsweredFromOneThatIsOpen) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->resume();
    const auto lost = world.call(world.client("client"), "lost", {});
    EXPECT_EQ(lost->wait(), std::nullopt);
    EXPECT_EQ(lost->state(), ClientCall::State::kDropped);
    const auto slow = world.call(world.client("client"), "slow", {});
    EXPECT_EQ(slow->state(), ClientCall::State::kOpen);
    EXPECT_FALSE(slow->waitForNs(kSecond / 2));
    EXPECT_TRUE(slow->waitForNs(kSecond));
    world.shutDown();
  });
}

TEST(SimulatedListener, CountsEveryAnswerAndKeepsTheFirst) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->resume();
    const auto call = world.call(world.client("client"), "twice", {});
    EXPECT_EQ(call->wait(), (Dictionary{{"n", 1}}));
    ASSERT_TRUE(world.eventually([&] { return call->answers() == 2; }));
    EXPECT_EQ(call->dictionary(), (Dictionary{{"n", 1}}));
    world.shutDown();
  });
}

TEST(SimulatedListener, UnknownMembersAndWrongArgumentsFail) {
  inEverySchedule(kSchedules, [] {
    World world;
    Served served;
    const auto listener = world.platform().makeListener(serving(served));
    listener->resume();
    const auto client = world.client("client");
    EXPECT_EQ(world.call(client, "unknown", {})->error(), "no method unknown");
    EXPECT_EQ(world.call(client, "quick", {std::string("1")})->error(),
              "wrong arguments for quick");
    world.shutDown();
  });
}

TEST(SimulatedAccess, GrantsWhatThePeerHoldsAndNothingWithoutAPeer) {
  SimulatedPeer peer("client", {"A", "B"});
  SimulatedAccess access;
  EXPECT_TRUE(access.connectionIsEntitled(&peer, {"A"}));
  EXPECT_TRUE(access.connectionIsEntitled(&peer, {"A", "B"}));
  EXPECT_FALSE(access.connectionIsEntitled(&peer, {"A", "C"}));
  EXPECT_FALSE(access.connectionIsEntitled(nullptr, {"A"}));
}

}  // namespace
}  // namespace spacekeep::sim
