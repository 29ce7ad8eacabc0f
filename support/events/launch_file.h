// Thread safety: pure functions.
//
// What stands in the launch file of a scheduled activity, and in the file that remembers its last
// run. Both are property lists holding one dictionary. The launch file:
//
//   "INTERVAL_SECONDS"          from one run to the next, 1 to 31536000. Required.
//   "RANDOM_DELAY_SECONDS"      each run comes later by up to this, at most the interval; default 0
//   "MAINS_POWER"               true: wait for mains power where there are power supplies
//   "MAINS_POWER_WAIT_SECONDS"  for how long, 0 to 86400; default 86400
#pragma once

#include <optional>
#include <string>
#include <variant>

#include "support/events/daily_schedule.h"
#include "support/values/value.h"

namespace spacekeep {

struct LaunchFileError {
  std::string reason;  ///< in words for a person
};

/// Any other key, and any value out of its range, is an error.
[[nodiscard]] std::variant<DailySchedule, LaunchFileError> scheduleFromDocument(
    const Value& document);

[[nodiscard]] Value documentFromRunRecord(const RunRecord& record);
/// None when the document is anything else; the activity then counts as one that never ran.
[[nodiscard]] std::optional<RunRecord> runRecordFromDocument(const Value& document);

}  // namespace spacekeep
