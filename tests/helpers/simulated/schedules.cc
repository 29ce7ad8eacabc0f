#include "tests/helpers/schedules.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdlib>
#include <exception>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include "tests/helpers/simulated/one_schedule.h"

namespace spacekeep {
namespace {

std::string replayLine(const rt::ScheduleOptions& options) {
  std::ostringstream line;
  line << "replay: SPACEKEEP_SCHEDULE=" << scheduleName(options) << " " << program_invocation_name;
  const ::testing::TestInfo* const test = ::testing::UnitTest::GetInstance()->current_test_info();
  if (test != nullptr) {
    line << " --gtest_filter=" << test->test_suite_name() << "." << test->name();
  }
  return line.str();
}

std::string describeEnd(const rt::ScheduleReport& report) {
  std::ostringstream text;
  switch (report.end) {
    case rt::ScheduleEnd::kFinished:
      text << "the schedule finished";
      break;
    case rt::ScheduleEnd::kDeadlock:
      text << "deadlock";
      break;
    case rt::ScheduleEnd::kStuck:
      text << "stuck";
      break;
  }
  text << " after " << report.steps << " steps and " << report.virtual_ns << " ns";
  for (const std::string& fiber : report.blocked) text << "\n  left: " << fiber;
  return text.str();
}

std::vector<rt::ScheduleOptions> onlyTheNamedSchedule() {
  const char* const name = std::getenv("SPACEKEEP_SCHEDULE");
  if (name == nullptr) return {};
  const rt::ScheduleOptions options = scheduleNamed(name);
  if (options.seed == 0) ADD_FAILURE() << "SPACEKEEP_SCHEDULE is no schedule: " << name;
  return {options};
}

/// False when this schedule failed the test.
bool runReporting(const rt::ScheduleOptions& options, const std::function<void()>& body,
                  rt::ScheduleReport& report) {
  const bool failed_before = ::testing::Test::HasFailure();
  try {
    report = runOneSchedule(options, body);
  } catch (const std::exception& error) {
    ADD_FAILURE() << "an exception left the schedule: " << error.what();
  }
  if (failed_before || !::testing::Test::HasFailure()) return true;
  std::cout << replayLine(options) << std::endl;
  return false;
}

}  // namespace

std::string scheduleName(const rt::ScheduleOptions& options) {
  const std::string seed = std::to_string(options.seed);
  if (options.strategy == rt::Strategy::kRandom) return "random:" + seed;
  return "pct:" + seed + ":" + std::to_string(options.pct_expected_steps);
}

rt::ScheduleOptions scheduleNamed(const std::string& name) {
  rt::ScheduleOptions options;
  options.seed = 0;
  std::istringstream parts(name);
  std::string strategy;
  char colon = 0;
  std::getline(parts, strategy, ':');
  if (strategy != "random" && strategy != "pct") return options;
  parts >> options.seed;
  if (strategy == "pct") {
    options.strategy = rt::Strategy::kPct;
    parts >> colon >> options.pct_expected_steps;
  }
  return options;
}

rt::ScheduleReport runOneSchedule(const rt::ScheduleOptions& options,
                                  const std::function<void()>& body) {
  rt::ScheduleReport report = rt::runSchedule(options, body);
  EXPECT_TRUE(report.end == rt::ScheduleEnd::kFinished && report.blocked.empty())
      << describeEnd(report);
  return report;
}

void inEverySchedule(unsigned seeds, const std::function<void()>& body) {
  rt::ScheduleReport report;
  if (const auto named = onlyTheNamedSchedule(); !named.empty()) {
    runReporting(named.front(), body, report);
    return;
  }
  for (std::uint64_t seed = 1; seed <= seeds; ++seed) {
    rt::ScheduleOptions options;
    options.seed = seed;
    options.strategy = seed % 2 == 1 ? rt::Strategy::kRandom : rt::Strategy::kPct;
    // The run before tells how long this one will be, which is what the change points need.
    if (report.steps > 0) options.pct_expected_steps = report.steps;
    if (!runReporting(options, body, report)) return;
  }
}

bool onRealThreads() { return false; }

}  // namespace spacekeep
