// What administrators and clients may set: the launch file, the record of its last run, and the
// settings in the client state. The input becomes a dictionary of the known keys with any values.
#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "client/state_settings.h"
#include "fuzz/helpers/promises.h"
#include "fuzz/helpers/value_maker.h"
#include "support/events/daily_schedule.h"
#include "support/events/launch_file.h"
#include "support/values/text.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::fuzz {
namespace {

const std::vector<std::string> kKeys{"INTERVAL_SECONDS",
                                     "RANDOM_DELAY_SECONDS",
                                     "MAINS_POWER",
                                     "MAINS_POWER_WAIT_SECONDS",
                                     "RUN_WALL_NANOSECONDS",
                                     "RUN_BOOT_NANOSECONDS",
                                     "RUN_BOOT_ID",
                                     "RUN_ELAPSED_NANOSECONDS",
                                     "SPACEKEEP_LOW_SPACE_BYTES",
                                     "SPACEKEEP_LOW_SPACE_PERCENT",
                                     "SPACEKEEP_LOW_SPACE_INODES_PERCENT",
                                     "SPACEKEEP_FINISH_EARLY"};

/// Only the keys of one reader, or its first check would be all that is ever run.
Dictionary keysFrom(const Dictionary& all, std::string_view prefix) {
  Dictionary some;
  for (const auto& [key, value] : all) {
    if (key.starts_with(prefix)) some.set(key, value);
  }
  return some;
}

Clocks clocksFrom(ValueMaker& maker) {
  return {.wall_ns = maker.integer(), .boot_ns = maker.bits() >> 1, .boot_id = maker.text()};
}

void plan(const DailySchedule& schedule, const RunRecord& record, ValueMaker& maker) {
  const Clocks now = clocksFrom(maker);
  // Far beyond any life of a machine, times are cut off so that sums of them stay in range.
  const std::uint64_t passed_ns = std::min(record.elapsed_ns, UINT64_MAX / 8);
  require(elapsedSince(recordAsOf(record, now), now) >= passed_ns,
          "time that had passed stays passed");
  const DailyPlan daily{.record = recordAsOf(record, now), .since_boot_ns = now.boot_ns};
  const DailyDecision decision = decideDaily(schedule, daily, now, maker.byte() % 2 == 1);
  require(decision.step == DailyStep::kRun || decision.wake_boot_ns > now.boot_ns,
          "a wait ends later than now");
}

void asLaunchFile(const Dictionary& document, ValueMaker& maker) {
  const auto outcome = scheduleFromDocument(document);
  const auto* schedule = std::get_if<DailySchedule>(&outcome);
  if (schedule == nullptr) {
    require(!std::get<LaunchFileError>(outcome).reason.empty(), "a refusal says why");
    return;
  }
  require(schedule->interval_seconds >= 1 && schedule->interval_seconds <= 31'536'000,
          "the interval is in its range");
  require(schedule->random_delay_seconds <= schedule->interval_seconds, "the delay is bounded");
  require(schedule->mains_power_wait_seconds <= 86400, "the wait for power is bounded");
  plan(*schedule, recordOfNoRun(*schedule, clocksFrom(maker)), maker);
}

void asRunRecord(const Dictionary& document, ValueMaker& maker) {
  const auto record = runRecordFromDocument(document);
  if (!record) return;
  require(runRecordFromDocument(documentFromRunRecord(*record)) == record,
          "a record is read as it was written");
  plan(DailySchedule{}, *record, maker);
}

void asState(const Dictionary& state) {
  std::size_t refusals = 0;
  const auto refuse = [&refusals](const std::string& problem) {
    require(isOneLine(problem), "a refusal is one line");
    ++refusals;
  };
  const LowSpaceSettings settings = lowSpaceSettingsFrom(state, refuse);
  require(settings.bytes >= kLeastLowSpaceBytes && settings.bytes <= kMostLowSpaceBytes,
          "the bytes are in their range");
  require(settings.percent >= 0 && settings.percent <= kMostLowSpacePercent,
          "the percentage is in its range");
  require(settings.inodes_percent >= 0 && settings.inodes_percent <= kMostLowSpacePercent,
          "the percentage of inodes is in its range");
  static_cast<void>(finishEarlyFrom(state, refuse));
  require(refusals <= 4, "a setting is refused once");
  for (const auto& [key, value] : state) static_cast<void>(isSettingKey(key));
}

}  // namespace
}  // namespace spacekeep::fuzz

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace spacekeep::fuzz;
  ValueMaker maker(inputOf(data, size), kKeys);
  const spacekeep::Dictionary all = maker.dictionary();
  asLaunchFile(all, maker);
  spacekeep::Dictionary launch = keysFrom(all, "MAINS");
  for (const auto& [key, value] : keysFrom(all, "INTERVAL")) launch.set(key, value);
  for (const auto& [key, value] : keysFrom(all, "RANDOM")) launch.set(key, value);
  asLaunchFile(launch, maker);
  asRunRecord(keysFrom(all, "RUN"), maker);
  asState(keysFrom(all, "SPACEKEEP"));
  return 0;
}
