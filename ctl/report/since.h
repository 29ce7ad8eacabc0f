// Thread safety: any thread, as long as nobody changes the time zone.
//
// Since when, as people write it.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

namespace spacekeep::ctl {

/// What is wrong with a text, for the person who wrote it.
struct SinceError {
  std::string text;
};

/// Nanoseconds since 1970 from an age before `now_ns` ("90m", "12h", "7d", "4w") or from a day or
/// moment of the local time zone ("2026-11-01", "2026-11-01 14:30", "2026-11-01T14:30:05").
[[nodiscard]] std::variant<std::int64_t, SinceError> parseSince(std::string_view text,
                                                                std::int64_t now_ns);

}  // namespace spacekeep::ctl
