// Thread safety: for one thread.
//
// The daemon's history, asked for page by page.
#pragma once

#include <spacekeep/client.h>

#include <cstdint>
#include <functional>
#include <optional>
#include <string>

#include "support/values/value.h"

namespace spacekeep::ctl {

struct WantedHistory {
  std::string volume;                    ///< empty: all
  std::optional<std::int64_t> since_ns;  ///< wall clock; entries that ended earlier are left out
};

/// Most entries that the daemon gives at a time.
inline constexpr std::uint64_t kMostOfOnePage = 1000;

using AskHistory = std::function<sdk::Reply(const Dictionary& request)>;

/// Asks over `client`, which must outlive what is answered. The deadline holds for each page.
[[nodiscard]] AskHistory historyOver(sdk::Client& client, sdk::Deadline deadline = {});

/// Gets an entry, answers whether older ones are wanted.
using TakeEntry = std::function<bool(const Dictionary& entry)>;

enum class PagesEnd {
  kOldest,    ///< there are no older entries
  kEnough,    ///< older ones were not wanted
  kRefused,   ///< this user has not the right
  kNotOlder,  ///< the daemon's pages do not get older: it would have been asked for ever
};

/// Shows the entries of `volume` (empty: of all), newest first, `page_entries` at a time.
[[nodiscard]] sdk::Result<PagesEnd> forEachEntry(const std::string& volume,
                                                 std::uint64_t page_entries, const AskHistory& ask,
                                                 const TakeEntry& take);

}  // namespace spacekeep::ctl
