// Thread safety: pure functions over plain values.
//
// The answer to a query for purgeable space, from the daemon's dictionary to something a person or
// a program can read.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "ctl/recent_answers.h"
#include "ctl/style.h"
#include "ctl/volume_space.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

struct ServiceSpace {
  std::string id;
  Value answer = 0;                    ///< as the service gave it
  std::optional<std::int64_t> bytes;   ///< none when the answer is not a number
  std::optional<AnswerOrigin> origin;  ///< none when it cannot be told
};

struct QueryReport {
  std::string volume;
  std::int64_t total_bytes = 0;             ///< the daemon's sum
  std::optional<MeasuredSpace> space;       ///< of the volume, when it could be measured
  std::vector<ServiceSpace> services = {};  ///< most bytes first, those without a number last
};

/// What the daemon had in memory before and after the query.
struct MemoryOfDaemon {
  std::optional<AnswerDates> before;
  std::optional<AnswerDates> after;
  Date now;
};

/// Whatever is missing in the answer, or of another kind than expected, reads as absent. Every key
/// that is not one of the daemon's own is a service's ID.
[[nodiscard]] QueryReport queryReport(const Dictionary& answer, const MemoryOfDaemon& memory,
                                      std::optional<MeasuredSpace> space);

/// One line with the total, and one on what came from memory when that is known; on a terminal
/// broken where its width demands it.
[[nodiscard]] std::string summaryOf(const QueryReport& report, const Style& style);
/// A table with a line per service; on a terminal fitted to its width.
[[nodiscard]] std::string itemizedTableOf(const QueryReport& report, const Style& style);
/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const QueryReport& report, bool itemized);

}  // namespace spacekeep::ctl
