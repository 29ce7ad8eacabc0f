// Plans by hand, and what really happens over many seeds: a scenario that silently does nothing
// would be noticed here.
#include "sim/scenarios/system_run.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <map>
#include <set>
#include <string>

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;

PlannedAction callAt(std::uint64_t at_ns, CallAction call, unsigned life = 0) {
  call.client = "client";
  return {life, at_ns, std::move(call)};
}

PlannedAction setAt(std::uint64_t at_ns, const char* key, Value value, unsigned life = 0) {
  CallAction call;
  call.member = "clientSetState";
  call.key = key;
  call.value = std::move(value);
  return callAt(at_ns, std::move(call), life);
}

PlannedAction getAt(std::uint64_t at_ns, const char* key, unsigned life = 0) {
  CallAction call;
  call.member = "clientGetState";
  call.key = key;
  return callAt(at_ns, std::move(call), life);
}

SystemPlan smallPlan() {
  SystemPlan plan;
  plan.volumes = {{"/", 1'000'000, 1000}};
  return plan;
}

SystemService declared(const std::string& id, std::uint64_t owned_bytes) {
  SystemService service;
  service.id = id;
  service.descriptor = Dictionary();
  service.behaviour = ownsBytes("/", owned_bytes);
  return service;
}

/// The calls of a member, in the order in which they were made.
std::vector<CallOfClient> callsOf(const SystemRun& run, const std::string& member) {
  std::vector<CallOfClient> calls;
  for (const auto& [number, call] : run.calls) {
    if (call.member == member) calls.push_back(call);
  }
  return calls;
}

template <class Body>
std::vector<Body> eventsOf(const SystemRun& run) {
  std::vector<Body> bodies;
  for (const Event& event : run.events) {
    if (const auto* body = std::get_if<Body>(&event.body)) bodies.push_back(*body);
  }
  return bodies;
}

TEST(SystemRun, ADaemonWithoutWorkStartsAndEnds) {
  const SystemRun run = playSystem(smallPlan(), 1);
  EXPECT_EQ(run.end, SystemEnd::kFinished);
  ASSERT_EQ(run.lives.size(), 1U);
  EXPECT_FALSE(run.lives[0].killed);
  EXPECT_EQ(run.lives[0].keep_alive_open, 0);
  EXPECT_TRUE(run.calls.empty());
}

TEST(SystemRun, ALowVolumeIsPurgedAndTheServiceThatOwnsLessGivesAllItHas) {
  SystemPlan plan = smallPlan();
  plan.services = {declared("cache", 5000)};
  plan.actions = {{0, 0, LowSpaceAction{{"/"}, {{"_Flags", 4U}}}}};
  const SystemRun run = playSystem(plan, 3);
  EXPECT_EQ(run.end, SystemEnd::kFinished);
  EXPECT_EQ(run.lives[0].free_at_end.at("/"), 6000U);
  EXPECT_EQ(run.lives[0].services.at("cache").owns_at_end.at("/")[1], 0U);
}

TEST(SystemRun, WhatWasAnsweredAsStoredIsThereInTheNextLife) {
  SystemPlan plan = smallPlan();
  plan.crashes = {{.at_step = 1'000'000, .down_for_ns = 5 * kSecond}};
  plan.actions = {setAt(0, "colour", "red"), getAt(0, "colour", 1)};
  const SystemRun run = playSystem(plan, 3);
  ASSERT_EQ(run.lives.size(), 2U);
  EXPECT_EQ(callsOf(run, "clientSetState").at(0).state, ClientCall::State::kAnswered);
  EXPECT_EQ(callsOf(run, "clientGetState").at(0).value, Value("red"));
  EXPECT_EQ(callsOf(run, "clientGetState").at(0).life, 1U);
}

TEST(SystemRun, ALifeThatIsKilledAtEachOfItsStepsIsFollowedByOneThatAnswers) {
  SystemPlan plan = smallPlan();
  plan.services = {declared("cache", 5000)};
  plan.actions = {setAt(0, "colour", "red"), getAt(0, "colour", 1)};
  const std::uint64_t whole_life = playSystem(plan, 1).steps;
  ASSERT_GT(whole_life, 100U);
  unsigned stored = 0;
  for (std::uint64_t step = 1; step < whole_life; step += 3) {
    plan.crashes = {{.at_step = step, .down_for_ns = kSecond}};
    const SystemRun run = playSystem(plan, 1);
    ASSERT_EQ(run.lives.size(), 2U);
    EXPECT_TRUE(run.lives[0].killed) << step;
    const std::vector<CallOfClient> gets = callsOf(run, "clientGetState");
    ASSERT_EQ(gets.size(), 1U);
    EXPECT_EQ(gets[0].state, ClientCall::State::kAnswered) << step;
    const std::vector<CallOfClient> sets = callsOf(run, "clientSetState");
    if (sets.empty() || sets[0].state != ClientCall::State::kAnswered) continue;
    ++stored;
    EXPECT_EQ(gets[0].value, Value("red")) << step;
  }
  EXPECT_GT(stored, 3U);
}

TEST(SystemRun, NothingOfAKilledLifeIsLeftBehind) {
  for (std::uint64_t seed = 1; seed <= 60; ++seed) {
    SystemPlan plan = deriveSystemScenario(seed);
    plan.crashes = {{.at_step = 50 * seed, .down_for_ns = kSecond}};
    for (const LifeOfDaemon& life : playSystem(plan, seed).lives) {
      for (const std::string& blocked : life.report.blocked) {
        EXPECT_EQ(blocked.find("could not be unwound"), std::string::npos) << seed << blocked;
      }
    }
  }
}

TEST(SystemRun, TheTimeLineAndTheWallClockGoOnInTheNextLife) {
  SystemPlan plan = smallPlan();
  plan.crashes = {{.at_step = 1'000'000, .down_for_ns = 7 * kSecond}};
  plan.actions = {{0, kSecond, ClockAction{-50 * static_cast<std::int64_t>(kSecond)}}};
  const SystemRun run = playSystem(plan, 5);
  ASSERT_EQ(run.lives.size(), 2U);
  const std::uint64_t passed = run.lives[0].report.virtual_ns + 7 * kSecond;
  EXPECT_EQ(run.lives[1].began_ns, passed);
  EXPECT_EQ(run.lives[1].wall_clock_began_ns - run.lives[0].wall_clock_began_ns,
            static_cast<std::int64_t>(passed) - 50 * static_cast<std::int64_t>(kSecond));
  EXPECT_TRUE(std::is_sorted(run.events.begin(), run.events.end(),
                             [](const Event& a, const Event& b) { return a.at_ns < b.at_ns; }));
}

TEST(SystemRun, SpaceThatWasStillToComeBackAtTheKillIsThereInTheNextLife) {
  SystemPlan plan = smallPlan();
  plan.services = {declared("cache", 5000)};
  plan.services[0].behaviour.purge[0].space_returns_after_ns = 3600 * kSecond;
  plan.crashes = {{.at_step = 1'000'000}};
  plan.actions = {{0, 0, LowSpaceAction{{"/"}, {{"_Flags", 4U}}}}};
  const SystemRun run = playSystem(plan, 3);
  ASSERT_EQ(run.lives.size(), 2U);
  EXPECT_EQ(run.lives[0].free_at_end.at("/"), 1000U);
  EXPECT_EQ(run.lives[1].free_at_end.at("/"), 6000U);
}

TEST(SystemRun, AWriteThatTheDiskRefusedIsRefusedToTheClient) {
  SystemPlan plan = smallPlan();
  plan.actions = {{0, 0, DiskAction{"no space left on device"}},
                  setAt(kSecond, "colour", "red"),
                  {0, 2 * kSecond, DiskAction{}},
                  getAt(3 * kSecond, "colour")};
  const SystemRun run = playSystem(plan, 3);
  const CallOfClient set = callsOf(run, "clientSetState").at(0);
  EXPECT_EQ(set.state, ClientCall::State::kFailed);
  EXPECT_EQ(set.error, "com.quorvel.Spacekeep.Error.NotStored: no space left on device");
  EXPECT_EQ(callsOf(run, "clientGetState").at(0).value, std::nullopt);
}

TEST(SystemRun, ADaemonWhoseStoreCannotBeOpenedAnswersWithoutState) {
  SystemPlan plan = smallPlan();
  plan.crashes = {{.at_step = 1'000'000, .down_for_ns = 0, .store_refuses_to_open = true}};
  plan.actions = {setAt(0, "colour", "red"), getAt(0, "colour", 1)};
  const SystemRun run = playSystem(plan, 3);
  EXPECT_EQ(callsOf(run, "clientGetState").at(0).value, std::nullopt);
  EXPECT_EQ(run.lives[1].disk_at_end, run.lives[1].disk_at_start);
}

TEST(SystemRun, ASilentPingHoldsEverybodyAndIsReportedAsThat) {
  SystemPlan plan = smallPlan();
  plan.faults = {Fault::kSilentPing};
  SystemService silent;
  silent.id = "silent";
  silent.check_in_info = {{"PURGE", true}};
  silent.behaviour.ping.answer = Answer::kNever;
  plan.services = {silent};
  CallAction purge;
  purge.rights = {"PURGE_ENTITLEMENT"};
  purge.member = "clientPurge";
  purge.info = {{"SPACEKEEP_VOLUME", "/"}, {"SPACEKEEP_AMOUNT", 5}};
  plan.actions = {callAt(kSecond, purge)};
  const SystemRun run = playSystem(plan, 3);
  EXPECT_EQ(run.end, SystemEnd::kSilentPing);
  EXPECT_FALSE(run.blocked.empty());
  EXPECT_EQ(callsOf(run, "clientPurge").at(0).state, ClientCall::State::kOpen);
}

// Seed 500491: nobody but the silent service's own check-in was left waiting.
TEST(SystemRun, ASilentPingIsReportedAlsoWhenNobodyElseWaits) {
  SystemPlan plan = smallPlan();
  plan.faults = {Fault::kSilentPing};
  SystemService silent;
  silent.id = "silent";
  silent.check_in_info = {{"PURGE", true}};
  silent.behaviour.ping.answer = Answer::kNever;
  plan.services = {silent};
  EXPECT_EQ(playSystem(plan, 3).end, SystemEnd::kSilentPing);
}

TEST(SystemRun, TheSameSilenceIsADeadlockWhereItWasNotPlanned) {
  SystemPlan plan = smallPlan();
  SystemService silent;
  silent.id = "silent";
  silent.check_in_info = {{"PURGE", true}};
  silent.behaviour.ping.answer = Answer::kNever;
  plan.services = {silent};
  EXPECT_EQ(playSystem(plan, 3).end, SystemEnd::kDeadlock);
}

TEST(SystemRun, ASeedMeansOneRun) {
  for (std::uint64_t seed = 1; seed <= 40; ++seed) {
    const SystemRun first = playSystem(deriveSystemScenario(seed), seed);
    const SystemRun second = playSystem(deriveSystemScenario(seed), seed);
    EXPECT_EQ(first.trace_hash, second.trace_hash);
    EXPECT_EQ(first.steps, second.steps);
    ASSERT_EQ(first.events.size(), second.events.size());
    for (std::size_t i = 0; i < first.events.size(); ++i) {
      ASSERT_EQ(textOfEvent(first.events[i]), textOfEvent(second.events[i])) << "seed " << seed;
    }
  }
}

// Data that had grown took space while a purge needed 5 bytes, so all of 100 MB was asked for in
// pieces of 5.
TEST(SystemRun, Seed207795DoesNotGoRoundInCircles) {
  EXPECT_EQ(playSystem(deriveSystemScenario(207'795), 207'795).end, SystemEnd::kFinished);
}

/// What has happened, counted over many runs from their traces alone.
class Counts {
 public:
  void add(const SystemRun& run) {
    for (const Event& event : run.events) std::visit(*this, event.body);
    for (const LifeOfDaemon& life : run.lives) ++of_[life.killed ? "killed" : "ended"];
    for (const auto& [number, call] : run.calls) {
      ++of_[call.member + (call.state == ClientCall::State::kAnswered ? "" : " not answered")];
    }
    if (run.end == SystemEnd::kSilentPing) ++of_["silent ping"];
  }
  void operator()(const ServiceAsked& asked) { ++of_[asked.member]; }
  void operator()(const ServiceAnswered& answered) {
    ++of_[answered.member + " answered"];
    if (answered.member != "servicePurge") return;
    if (answered.amount.value_or(0) > answered.freed) ++of_["claims more"];
    if (answered.amount && *answered.amount < answered.freed) ++of_["claims less"];
    if (!answered.amount) ++of_["no amount"];
  }
  void operator()(const ServiceCallFailed& failed) { ++of_[failed.member + " failed"]; }
  void operator()(const DiskWritten&) { ++of_["disk written"]; }
  void operator()(const DiskRefused&) { ++of_["disk refused"]; }
  void operator()(const ClockJumped& jump) { ++of_[jump.by_ns > 0 ? "forward" : "back"]; }
  void operator()(const StreamEventSent& sent) {
    ++of_["low volumes " + std::to_string(std::min<std::size_t>(sent.low_volumes.size(), 2))];
  }
  void operator()(const ActivityRan&) { ++of_["activity"]; }
  void operator()(const WorldChanged& changed) {
    for (const char* end : {" dies", " starts", " closes its connections", " more on /"}) {
      if (changed.what.ends_with(end)) ++of_[end];
    }
  }
  template <class Other>
  void operator()(const Other&) {}

  [[nodiscard]] std::uint64_t of(const std::string& what) const {
    const auto found = of_.find(what);
    return found == of_.end() ? 0 : found->second;
  }

 private:
  std::map<std::string, std::uint64_t> of_;
};

TEST(SystemRun, EverythingThatAPlanMayHoldReallyHappens) {
  Counts counts;
  for (std::uint64_t seed = 1; seed <= 2000; ++seed) {
    counts.add(playSystem(deriveSystemScenario(seed), seed));
  }
  for (const char* what : {"clientPurge",
                           "clientPurgeableSpace",
                           "clientItemizedPurgeableSpace",
                           "clientCancelPurge",
                           "clientSetState",
                           "clientGetState",
                           "clientCheckin",
                           "clientCheckin not answered",
                           "clientPurge not answered",
                           "clientSetState not answered",
                           "servicePing",
                           "servicePurge",
                           "servicePurgeable",
                           "servicePeriodic",
                           "serviceCancelPurge",
                           "serviceNotify",
                           "servicePurge answered",
                           "servicePurgeable answered",
                           "servicePeriodic answered",
                           "servicePurge failed",
                           "servicePurgeable failed",
                           "claims more",
                           "claims less",
                           "no amount",
                           "disk written",
                           "disk refused",
                           "forward",
                           "back",
                           "low volumes 0",
                           "low volumes 1",
                           "low volumes 2",
                           "activity",
                           " dies",
                           " starts",
                           " closes its connections",
                           " more on /",
                           "killed",
                           "ended",
                           "silent ping"}) {
    EXPECT_GE(counts.of(what), 5U) << what;
  }
}

}  // namespace
}  // namespace spacekeep::sim
