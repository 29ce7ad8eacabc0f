#include <gtest/gtest.h>

#include <set>

#include "sim/invariants/invariants.h"
#include "sim/program/one_run.h"
#include "sim/program/options.h"
#include "sim/program/play.h"
#include "sim/scenarios/purge_run.h"

namespace spacekeep::sim {
namespace {

TEST(PurgeScenario, ASeedMeansOneScenario) {
  EXPECT_EQ(textOf(derivePurgeScenario(7)), textOf(derivePurgeScenario(7)));
  EXPECT_NE(textOf(derivePurgeScenario(7)), textOf(derivePurgeScenario(8)));
}

TEST(PurgeScenario, HoldsNoFaultThatWouldBeUnfair) {
  for (std::uint64_t seed = 1; seed <= 500; ++seed) {
    const PurgeScenario scenario = derivePurgeScenario(seed);
    EXPECT_GE(scenario.services.size(), 1U);
    EXPECT_LE(scenario.services.size(), 8U);
    std::set<std::string> ids;
    for (const PlannedService& service : scenario.services) {
      EXPECT_TRUE(ids.insert(service.id).second) << "seed " << seed << ": two of " << service.id;
      EXPECT_EQ(service.behaviour.ping.answer, Answer::kReplies) << "seed " << seed;
      const CallBehaviour& last = service.behaviour.purge.back();
      EXPECT_LE(last.percent_reported, 100U) << "seed " << seed;
      EXPECT_EQ(last.reported_extra, 0U) << "seed " << seed;
    }
    std::set<std::uint64_t> amounts;
    for (const PlannedPurge& purge : scenario.purges) {
      const auto amount = unsignedAt(purge.info, "SPACEKEEP_AMOUNT");
      EXPECT_TRUE(!amount || amounts.insert(*amount).second) << "seed " << seed;
    }
  }
}

TEST(PurgeScenario, BothStrategiesTakeTurns) {
  EXPECT_EQ(scheduleFor(2).strategy, rt::Strategy::kRandom);
  EXPECT_EQ(scheduleFor(3).strategy, rt::Strategy::kPct);
}

TEST(PurgeRun, ASeedMeansOneRun) {
  for (const std::uint64_t seed : {11U, 12U}) {
    const PurgeRun first = runPurgeScenario(seed);
    const PurgeRun second = runPurgeScenario(seed);
    EXPECT_EQ(first.report.trace_hash, second.report.trace_hash);
    ASSERT_EQ(first.events.size(), second.events.size());
    for (std::size_t i = 0; i < first.events.size(); ++i) {
      ASSERT_EQ(textOfEvent(first.events[i]), textOfEvent(second.events[i]));
    }
  }
}

TEST(PurgeRun, EveryInvariantHoldsInTheFirstSeeds) {
  std::vector<std::string> failures;
  const Options options{.scenario = Scenario::kPurge,
                        .seeds = 300,
                        .first = 1,
                        .jobs = 1,
                        .replay = {},
                        .without = {}};
  const Played played =
      playSeeds(options, 0, [&](const std::string& story) { failures.push_back(story); });
  EXPECT_EQ(played.runs, 300U);
  EXPECT_EQ(played.repeated, 3U);
  EXPECT_TRUE(failures.empty()) << failures.front();
}

TEST(Options, DefaultsAreAThousandSeedsOnTwoProcesses) {
  const auto options = std::get<Options>(parseOptions({}));
  EXPECT_EQ(options.seeds, 1000U);
  EXPECT_EQ(options.first, 1U);
  EXPECT_EQ(options.jobs, 2U);
  EXPECT_EQ(options.scenario, Scenario::kSystem);
  EXPECT_FALSE(options.stop_at_first);
  EXPECT_FALSE(options.replay);
}

TEST(Options, ElementsToLeaveOutAreAListOfNumbersInAnyOrder) {
  const auto options = std::get<Options>(parseOptions({"--replay", "7", "--without", "9,0,12,9"}));
  EXPECT_EQ(options.without, (std::vector<std::size_t>{0, 9, 12}));
}

TEST(Options, ElementsCanOnlyBeLeftOutOfAReplay) {
  const auto parsed = parseOptions({"--without", "1"});
  const auto* error = std::get_if<OptionError>(&parsed);
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->text, "--without goes with --replay: see --help");
}

TEST(Options, AnotherScheduleIsOfAReplayOfTheWholeDaemon) {
  const auto options = std::get<Options>(parseOptions({"--replay", "7", "--schedule", "12"}));
  EXPECT_EQ(options.schedule, 12U);
  EXPECT_EQ(std::get<OptionError>(parseOptions({"--schedule", "12"})).text,
            "--schedule goes with --replay: see --help");
  EXPECT_EQ(std::get<OptionError>(
                parseOptions({"--scenario", "purge", "--replay", "7", "--schedule", "12"}))
                .text,
            "--schedule goes with the system scenario: see --help");
}

TEST(OneRun, AnotherScheduleIsAnotherOrderOfTheSamePlanAndTheSameEachTime) {
  const Verdict own = playOnce(Scenario::kSystem, 3);
  const Verdict other = playOnce(Scenario::kSystem, 3, {}, 5);
  EXPECT_NE(own.hash, other.hash);
  EXPECT_EQ(playOnce(Scenario::kSystem, 3, {}, 5).hash, other.hash);
  EXPECT_EQ(playOnce(Scenario::kSystem, 3, {}, 0).hash, own.hash);
}

TEST(Options, TheScenarioIsOneOfTwo) {
  EXPECT_EQ(std::get<Options>(parseOptions({"--scenario", "purge"})).scenario, Scenario::kPurge);
  EXPECT_EQ(std::get<Options>(parseOptions({"--scenario", "system"})).scenario, Scenario::kSystem);
  EXPECT_TRUE(std::get<Options>(parseOptions({"--stop"})).stop_at_first);
}

TEST(Options, AreReadInAnyOrder) {
  const auto options =
      std::get<Options>(parseOptions({"--first", "5", "--seeds", "9", "--jobs", "1"}));
  EXPECT_EQ(options.seeds, 9U);
  EXPECT_EQ(options.first, 5U);
  EXPECT_EQ(options.jobs, 1U);
  EXPECT_EQ(std::get<Options>(parseOptions({"--replay", "77"})).replay, 77U);
}

TEST(Options, WhatCannotBeUsedIsNamed) {
  for (const std::vector<std::string>& wrong :
       std::vector<std::vector<std::string>>{{"--seeds"},
                                             {"--seeds", "many"},
                                             {"--seeds", "-1"},
                                             {"--jobs", "0"},
                                             {"--jobs", "65"},
                                             {"--speed", "1"},
                                             {"--scenario", "everything"},
                                             {"--without", "1,x"},
                                             {"--replay", "3x"}}) {
    const auto parsed = parseOptions(wrong);
    const auto* error = std::get_if<OptionError>(&parsed);
    ASSERT_NE(error, nullptr) << wrong.front();
    EXPECT_EQ(error->text, "cannot use " + wrong.front() + ": see --help");
  }
}

}  // namespace
}  // namespace spacekeep::sim
