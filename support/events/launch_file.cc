#include "support/events/launch_file.h"

#include <string_view>

namespace spacekeep {
namespace {

constexpr std::uint64_t kDaySeconds = 86400;
constexpr std::uint64_t kLongestIntervalSeconds = 365 * kDaySeconds;

constexpr std::string_view kInterval = "INTERVAL_SECONDS";
constexpr std::string_view kRandomDelay = "RANDOM_DELAY_SECONDS";
constexpr std::string_view kMainsPower = "MAINS_POWER";
constexpr std::string_view kMainsPowerWait = "MAINS_POWER_WAIT_SECONDS";

constexpr std::string_view kRunWall = "RUN_WALL_NANOSECONDS";
constexpr std::string_view kRunBoot = "RUN_BOOT_NANOSECONDS";
constexpr std::string_view kRunBootId = "RUN_BOOT_ID";
constexpr std::string_view kRunElapsed = "RUN_ELAPSED_NANOSECONDS";

using Problem = std::optional<LaunchFileError>;

Problem readSeconds(const Dictionary::Entry& entry, std::uint64_t least, std::uint64_t most,
                    std::uint64_t& seconds) {
  const auto number = entry.value.asSigned();
  if (!number || *number < 0 || static_cast<std::uint64_t>(*number) < least ||
      static_cast<std::uint64_t>(*number) > most) {
    return LaunchFileError{entry.key + " must be a number from " + std::to_string(least) + " to " +
                           std::to_string(most)};
  }
  seconds = static_cast<std::uint64_t>(*number);
  return std::nullopt;
}

Problem readEntry(const Dictionary::Entry& entry, DailySchedule& schedule) {
  if (entry.key == kInterval) {
    return readSeconds(entry, 1, kLongestIntervalSeconds, schedule.interval_seconds);
  }
  if (entry.key == kRandomDelay) {
    return readSeconds(entry, 0, kLongestIntervalSeconds, schedule.random_delay_seconds);
  }
  if (entry.key == kMainsPowerWait) {
    return readSeconds(entry, 0, kDaySeconds, schedule.mains_power_wait_seconds);
  }
  if (entry.key == kMainsPower) {
    if (entry.value.boolean() == nullptr) return LaunchFileError{entry.key + " must be a boolean"};
    schedule.wants_mains_power = *entry.value.boolean();
    return std::nullopt;
  }
  return LaunchFileError{"unknown key " + entry.key};
}

}  // namespace

std::variant<DailySchedule, LaunchFileError> scheduleFromDocument(const Value& document) {
  const Dictionary* dictionary = document.dictionary();
  if (dictionary == nullptr) return LaunchFileError{"the document is no dictionary"};
  if (!dictionary->contains(kInterval)) {
    return LaunchFileError{std::string(kInterval) + " is missing"};
  }
  DailySchedule schedule;
  schedule.mains_power_wait_seconds = kDaySeconds;
  for (const Dictionary::Entry& entry : *dictionary) {
    if (Problem problem = readEntry(entry, schedule)) return *problem;
  }
  if (schedule.random_delay_seconds > schedule.interval_seconds) {
    return LaunchFileError{std::string(kRandomDelay) + " must not be longer than the interval"};
  }
  return schedule;
}

Value documentFromRunRecord(const RunRecord& record) {
  return Dictionary{{std::string(kRunWall), record.wall_ns},
                    {std::string(kRunBoot), record.boot_ns},
                    {std::string(kRunBootId), record.boot_id},
                    {std::string(kRunElapsed), record.elapsed_ns}};
}

std::optional<RunRecord> runRecordFromDocument(const Value& document) {
  const Dictionary* dictionary = document.dictionary();
  if (dictionary == nullptr) return std::nullopt;
  const Value* wall = dictionary->find(kRunWall);
  const auto boot = unsignedAt(*dictionary, kRunBoot);
  const std::string* boot_id = stringAt(*dictionary, kRunBootId);
  const auto elapsed = unsignedAt(*dictionary, kRunElapsed);
  if (wall == nullptr || !wall->asSigned() || !boot || boot_id == nullptr || !elapsed) {
    return std::nullopt;
  }
  return RunRecord{
      .wall_ns = *wall->asSigned(), .boot_ns = *boot, .boot_id = *boot_id, .elapsed_ns = *elapsed};
}

}  // namespace spacekeep
