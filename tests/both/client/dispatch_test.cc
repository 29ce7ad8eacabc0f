// From requests to operations.
#include <gtest/gtest.h>

#include "support/runtime/guarded.h"
#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using Outcomes = rt::Guarded<std::vector<Dictionary>>;

Dictionary purgeRequest(std::uint64_t amount_bytes) {
  return {{keys::kVolume, "/"},
          {keys::kAmount, amount_bytes},
          {keys::kUrgency, 1},
          {keys::kPurgeTimeout, 300},
          {keys::kFinishEarly, true}};
}

OperationCompletion collecting(const std::shared_ptr<Outcomes>& seen) {
  return [seen](const Dictionary& outcome) {
    seen->update([&](std::vector<Dictionary>& list) { list.push_back(outcome); });
  };
}

TEST(PurgeDispatch, TheCallbackSeesEveryOutcomeAndTheLastOneIsTheAnswer) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    // Both are asked before the first of them answers and can end the wait.
    sim::ServiceBehaviour slow = sim::ownsBytes("/", 15);
    slow.purge = {sim::CallBehaviour{.delay_ns = 10'000'000'000}};
    world.world.declareService("a", slow);
    world.world.declareService("b", slow);
    world.start();
    const auto seen = std::make_shared<Outcomes>();
    const Dictionary request{{keys::kVolume, "/"},
                             {keys::kAmount, 1000},
                             {keys::kUrgency, 1},
                             {keys::kPurgeTimeout, 300}};
    const auto answer = world.daemon->purge(request, collecting(seen));
    ASSERT_TRUE(answer.has_value());
    const auto outcomes = seen->get();
    ASSERT_EQ(outcomes.size(), 3U);
    EXPECT_EQ(outcomes.back(), *answer);
    EXPECT_EQ(unsignedAt(*answer, keys::kAmount), 30U);
  });
}

TEST(PurgeDispatch, WhatIsReportedAfterTheEndReachesTheCallbackAndIsNotTheAnswer) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::ServiceBehaviour late = sim::ownsBytes("/", 15);
    late.purge = {sim::CallBehaviour{.delay_ns = 5'000'000'000}};
    world.world.declareService("late", late);
    world.start();
    const auto seen = std::make_shared<Outcomes>();
    const Dictionary request{{keys::kVolume, "/"}, {keys::kAmount, 1000}, {keys::kUrgency, 1}};
    const auto answer = world.daemon->purge(request, collecting(seen));
    ASSERT_TRUE(answer.has_value());
    EXPECT_EQ(unsignedAt(*answer, keys::kAmount), 0U);
    EXPECT_TRUE(world.eventually([&] { return seen->get().size() == 2; }));
    EXPECT_EQ(seen->get().front(), *answer);
    EXPECT_EQ(unsignedAt(seen->get().back(), keys::kAmount), 15U);
  });
}

TEST(PurgeDispatch, WithoutATokenRunsUnderAFreshOneThatNobodyLearns) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    int tokens_made = 0;
    world.platform.createSpacekeepToken = [&] {
      ++tokens_made;
      return Value("fresh");
    };
    const auto cache = world.world.declareService("cache", sim::ownsBytes("/", 5000));
    world.start();
    const auto answer = world.daemon->purge(purgeRequest(1000), nullptr);
    ASSERT_TRUE(answer.has_value());
    EXPECT_EQ(tokens_made, 1);
    EXPECT_FALSE(answer->contains(keys::kToken));
    EXPECT_FALSE(cache->callsOf("servicePurge").front().info.contains(keys::kToken));
  });
}

TEST(PurgeDispatch, WithATokenAsksForNoOther) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    int tokens_made = 0;
    world.platform.createSpacekeepToken = [&] {
      ++tokens_made;
      return Value("fresh");
    };
    world.start();
    Dictionary request = purgeRequest(0);
    request.set(keys::kToken, "mine");
    EXPECT_EQ(*world.daemon->purge(request, nullptr)->find(keys::kToken), Value("mine"));
    EXPECT_EQ(tokens_made, 0);
  });
}

TEST(PurgeDispatch, ARefusedRequestAnswersNoneAndCallsNobody) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    const auto seen = std::make_shared<Outcomes>();
    EXPECT_EQ(world.daemon->purge(Value("no dictionary"), collecting(seen)), std::nullopt);
    EXPECT_EQ(world.daemon->purge(Dictionary{}, collecting(seen)), std::nullopt);
    EXPECT_TRUE(seen->get().empty());
    EXPECT_TRUE(world.world.trace().hasLine("initWithInfo info is not a dictionary!"));
  });
}

// The table of running purges is only absent because nobody assigns it: the steps are carried out.
TEST(PurgeDispatch, WithATableARunningPurgeCouldBeFoundAndCancelled) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 5000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    held.cancel_stops_purge = true;
    const auto cache = world.world.declareService("cache", held);
    world.start();
    world.daemon->collection_queue()->sync(
        [&] { world.daemon->setPurgeOperations(PurgeOperations()); });
    Dictionary request = purgeRequest(1000);
    request.set(keys::kToken, "mine");
    rt::Thread purging("purging", [&] { world.daemon->purge(request, nullptr); });
    EXPECT_TRUE(world.eventually([&] { return cache->callCount("servicePurge") == 1; }));
    world.daemon->clientCancelPurge({{keys::kToken, "other"}}, nullptr);
    world.daemon->clientCancelPurge({{keys::kToken, "mine"}}, nullptr);
    purging.join();
    EXPECT_EQ(cache->callCount("serviceCancelPurge"), 1U);
    bool is_gone = false;
    world.daemon->collection_queue()->sync(
        [&] { is_gone = world.daemon->purgeOperations()->find(Value("mine")) == nullptr; });
    EXPECT_TRUE(is_gone);
  });
}

TEST(PurgeDispatch, TwoPurgesAtOnceRunOneAfterTheOther) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    const auto cache = world.world.declareService("cache", sim::ownsBytes("/", 5000));
    world.start();
    std::optional<Dictionary> first;
    std::optional<Dictionary> second;
    rt::Thread one("one", [&] { first = world.daemon->purge(purgeRequest(1000), nullptr); });
    rt::Thread two("two", [&] { second = world.daemon->purge(purgeRequest(500), nullptr); });
    one.join();
    two.join();
    ASSERT_TRUE(first.has_value());
    ASSERT_TRUE(second.has_value());
    EXPECT_EQ(unsignedAt(*first, keys::kAmount), 1000U);
    EXPECT_EQ(unsignedAt(*second, keys::kAmount), 500U);
    EXPECT_EQ(cache->ownedBytes("/"), 3500U);
    // The second one measures from where the first one ended.
    const auto begin_one = *unsignedAt(*first, keys::kFreespaceBegin);
    const auto begin_two = *unsignedAt(*second, keys::kFreespaceBegin);
    EXPECT_EQ(begin_one + begin_two, begin_one == 0 ? 1000U : 500U);
  });
}

TEST(PurgeDispatch, AServiceThatLeavesDuringThePurgeIsStillInItsSnapshot) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 5000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    const auto stays = world.world.declareService("stays", held);
    world.start();
    const auto leaves = world.world.addService("leaves", held);
    world.world.checkIn(leaves, {{"PURGE", true}})->wait();
    std::optional<Dictionary> outcome;
    rt::Thread purging("purging", [&] {
      outcome = world.daemon->purge(Dictionary{{keys::kVolume, "/"},
                                               {keys::kAmount, 1000},
                                               {keys::kUrgency, 1},
                                               {keys::kPurgeTimeout, 300}},
                                    nullptr);
    });
    EXPECT_TRUE(world.eventually([&] {
      return stays->callCount("servicePurge") == 1 && leaves->callCount("servicePurge") == 1;
    }));
    leaves->closeConnections();
    EXPECT_TRUE(world.eventually([&] { return world.services().size() == 1; }));
    stays->answerHeldCalls();
    purging.join();
    ASSERT_TRUE(outcome.has_value());
    EXPECT_GE(unsignedAt(*outcome, keys::kAmount), 500U);
  });
}

TEST(RequestsInFlight, CountsTheElements) {
  inEverySchedule(kSchedules, [] {
    DaemonWorld world;
    world.start();
    EXPECT_EQ(world.daemon->requestsInFlight({}), 0U);
    EXPECT_EQ(world.daemon->requestsInFlight({1, "two", 3}), 3U);
  });
}

}  // namespace
}  // namespace spacekeep::test
