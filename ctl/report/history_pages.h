// Thread safety: for one thread.
//
// The daemon's history as a whole, page by page.
#pragma once

#include <spacekeep/client.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "ctl/survey.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

struct WantedHistory {
  std::string volume;                    ///< empty: all
  std::optional<std::int64_t> since_ns;  ///< wall clock; entries that ended earlier are left out
};

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

using AskHistory = std::function<sdk::Reply(const Dictionary& request)>;

/// Asks for page after page until the daemon says that there is no older one. A daemon whose pages
/// do not get older is a failure, not a loop without end.
[[nodiscard]] History readHistory(const WantedHistory& wanted, const AskHistory& ask);

}  // namespace spacekeep::ctl
