// Thread safety: each function is for one thread; they share nothing.
//
// What the tool does once its command line is understood. Results go to standard output, progress,
// remarks and complaints to standard error.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "ctl/complaint.h"
#include "ctl/state_value.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

struct PurgeOptions {
  std::string volume;
  std::uint64_t amount = 0;  ///< bytes
  std::optional<int> urgency;
  std::optional<std::uint64_t> timeout_seconds;
  std::optional<std::string> token;
  bool wait_all = false;
};

struct QueryOptions {
  std::string volume;
  std::optional<int> urgency;
  bool itemized = false;
};

struct StateOptions {
  std::string key;
  std::string value;
  ValueType type = ValueType::kGuessed;
  bool force = false;
  bool names = false;  ///< list: only the keys
};

struct VolumesOptions {
  bool names = false;  ///< only the mount points
};

/// status, explain
struct OneVolumeOptions {
  std::string volume;  ///< empty: all
};

struct ReportOptions {
  std::string file;                      ///< "-": standard output
  std::string volume;                    ///< empty: all
  std::optional<std::int64_t> since_ns;  ///< wall clock; none: as far back as is known
};

struct HistoryOptions {
  std::string volume;                    ///< empty: all
  std::optional<std::int64_t> since_ns;  ///< as above
  std::size_t limit = 20;
};

struct DoctorOptions {
  std::string root;  ///< of the system to look at; empty: this one
};

[[nodiscard]] ExitCode runPurge(const CommonOptions& common, const PurgeOptions& options);
[[nodiscard]] ExitCode runCancel(const CommonOptions& common, const std::string& token);
[[nodiscard]] ExitCode runQuery(const CommonOptions& common, const QueryOptions& options);
[[nodiscard]] ExitCode runStateGet(const CommonOptions& common, const StateOptions& options);
[[nodiscard]] ExitCode runStateSet(const CommonOptions& common, const StateOptions& options);
[[nodiscard]] ExitCode runStateUnset(const CommonOptions& common, const StateOptions& options);
[[nodiscard]] ExitCode runStateList(const CommonOptions& common, const StateOptions& options);
[[nodiscard]] ExitCode runVolumes(const CommonOptions& common, const VolumesOptions& options);
[[nodiscard]] ExitCode runStatus(const CommonOptions& common, const OneVolumeOptions& options);
[[nodiscard]] ExitCode runExplain(const CommonOptions& common, const OneVolumeOptions& options);
[[nodiscard]] ExitCode runHistory(const CommonOptions& common, const HistoryOptions& options);
[[nodiscard]] ExitCode runReport(const CommonOptions& common, const ReportOptions& options);
[[nodiscard]] ExitCode runDoctor(const CommonOptions& common, const DoctorOptions& options);

}  // namespace spacekeep::ctl
