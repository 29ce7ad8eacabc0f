// Thread safety: pure functions over constant tables.
//
// The keys of the client state that mean something to the daemon.
#pragma once

#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "support/values/value.h"

namespace spacekeep::ctl {

inline constexpr const char* kWholeStateKey = "SPACEKEEP_USER_DEFAULTS";
inline constexpr const char* kRecentStatsKey = "SPACEKEEP_RECENT_SERVICE_STATS";

struct KnownKey {
  std::string_view name;
  std::string_view meaning;       ///< a few words
  std::string_view default_text;  ///< what holds while it is not set; empty: there is nothing
  bool is_bytes = false;          ///< a number of bytes, so a size says more
};

/// Those that a person may set, in the order of their names.
[[nodiscard]] std::span<const KnownKey> settableKeys();
/// Also the one that the daemon keeps for itself; null for a key without a meaning.
[[nodiscard]] const KnownKey* knownKey(std::string_view name);

/// Why the daemon would not work with that value; none when it would.
[[nodiscard]] std::optional<std::string> objectionTo(std::string_view key, const Value& value);

/// As printStateValue(), and for a number of bytes its size too.
[[nodiscard]] std::string printValueOf(std::string_view key, const Value& value);

}  // namespace spacekeep::ctl
