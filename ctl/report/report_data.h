// Thread safety: pure functions over plain values.
//
// What a page tells.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "ctl/report/whole_history.h"
#include "ctl/status_report.h"

namespace spacekeep::ctl {

struct ReportData {
  std::string host;
  std::int64_t made_ns = 0;  ///< wall clock
  WantedHistory wanted;
  StatusReport status;
  History history;
};

/// One object with the members host, made, since, volume, volumes (as in the JSON of "status"),
/// entries (see pageEntryOf()), older_left_out, and, when something is missing, offers_problem and
/// history_problem with the reason.
[[nodiscard]] std::string jsonOf(const ReportData& data);

}  // namespace spacekeep::ctl
