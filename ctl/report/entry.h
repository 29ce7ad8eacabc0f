// Thread safety: pure functions over plain values.
//
// An entry of the daemon's history as the page wants it.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "support/values/value.h"

namespace spacekeep::ctl {

/// The members of the page's entry: number, date (seconds since 1970), kind, client (text), volume,
/// asked, limit, urgency, begin, end, freed, reported, services (bytes by ID), others, silent (IDs),
/// seconds, cancelled, why. What is missing in `entry`, or of another kind than expected, is left
/// out.
[[nodiscard]] Value pageEntryOf(const Dictionary& entry);

/// When it ended, nanoseconds since 1970.
[[nodiscard]] std::optional<std::int64_t> dateOf(const Dictionary& entry);

/// "apt-get (user 0, apt.service)"; empty for what the daemon did by itself.
[[nodiscard]] std::string clientTextOf(const Dictionary& entry);

}  // namespace spacekeep::ctl
