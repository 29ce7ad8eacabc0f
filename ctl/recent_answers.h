// Thread safety: pure functions over plain values.
//
// Which of the amounts in an answer the daemon had in memory. The answer does not tell, but the
// daemon's memory can be read: what was in there before the question, and still is with the same
// date, was not asked again.
#pragma once

#include <map>
#include <optional>
#include <string>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// When each service last answered about one volume, by service ID.
using AnswerDates = std::map<std::string, Date>;

/// From the value under "SPACEKEEP_RECENT_SERVICE_STATS" of the client state. No value means that
/// nothing is in memory; none comes out when the value is not the record that this program knows.
[[nodiscard]] std::optional<AnswerDates> answerDates(const std::optional<Value>& recent_stats,
                                                     const std::string& volume);

struct AnswerOrigin {
  bool from_memory = false;  ///< else it was asked for just now
  double age_seconds = 0;    ///< at the end of the query
  bool operator==(const AnswerOrigin&) const = default;
};

/// None for a service that is not in the memory afterwards.
[[nodiscard]] std::optional<AnswerOrigin> originOf(const std::string& service_id,
                                                   const AnswerDates& before,
                                                   const AnswerDates& after, Date now);

/// "from memory, 12 s ago", "asked now", empty when unknown.
[[nodiscard]] std::string textOf(const std::optional<AnswerOrigin>& origin);

}  // namespace spacekeep::ctl
