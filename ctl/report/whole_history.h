// Thread safety: for one thread.
//
// The daemon's history as a whole, for the page.
#pragma once

#include <cstddef>
#include <optional>

#include "ctl/history/pages.h"
#include "ctl/survey.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

struct History {
  enum class Access {
    kRead,
    kNotKept,  ///< the daemon knows no history
    kRefused,  ///< this user has not the right
    kFailed,
  };
  Access access = Access::kRead;
  Array entries = {};                         ///< as the daemon keeps them, newest first
  bool older_left_out = false;                ///< there are more than kMostEntries
  std::optional<SurveyProblem> problem = {};  ///< why something is missing
};

/// More than a daemon keeps. What is beyond would make the page slow.
inline constexpr std::size_t kMostEntries = 20'000;

/// Asks for page after page until the daemon says that there is no older one. A daemon whose pages
/// do not get older is a failure, not a loop without end.
[[nodiscard]] History readHistory(const WantedHistory& wanted, const AskHistory& ask);

}  // namespace spacekeep::ctl
