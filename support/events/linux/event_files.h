// Thread safety: may be called from any thread, for one path from one at a time.
//
// The two files of a scheduled activity: its launch file and the memory of its last run.
#pragma once

#include <optional>
#include <string>
#include <variant>
#include <vector>

#include "support/events/launch_file.h"

namespace spacekeep {

/// The launch file of the activity `name`: "<directory>/<name>.plist" of the first directory that
/// has such a file. None when there is none.
[[nodiscard]] std::optional<std::string> findLaunchFile(const std::vector<std::string>& directories,
                                                        const std::string& name);
/// What stands in a launch file.
[[nodiscard]] std::variant<DailySchedule, LaunchFileError> readSchedule(const std::string& path);

/// The schedule from "<directory>/<name>.plist" of the first directory that has such a file. None
/// when there is none or it is broken, which is logged; a broken file hides those behind it.
[[nodiscard]] std::optional<DailySchedule> loadSchedule(const std::vector<std::string>& directories,
                                                        const std::string& name);

/// None when there is none; an unreadable one is logged.
[[nodiscard]] std::optional<RunRecord> loadRunRecord(const std::string& path);

/// Replaces the file durably: after a power cut it is the old one or the new one. Answers none on
/// success, else what went wrong in words.
[[nodiscard]] std::optional<std::string> saveRunRecord(const std::string& path,
                                                       const RunRecord& record);

}  // namespace spacekeep
