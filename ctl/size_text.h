// Thread safety: pure functions.
//
// Sizes as people write and read them.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>

namespace spacekeep::ctl {

/// What is wrong with a text, for the person who wrote it.
struct SizeError {
  std::string text;
};

/// Bytes from "1000000", "500M", "1.5GiB", "2g", "750 MB". Without a unit, or with B: bytes.
/// K M G T P and KiB MiB GiB TiB PiB count in steps of 1024, kB MB GB TB PB in steps of 1000; upper
/// and lower case are the same. A fraction needs a unit; what is below one byte is cut off.
[[nodiscard]] std::variant<std::uint64_t, SizeError> parseSize(std::string_view text);

/// "512 B", "1.5 GiB": steps of 1024, one decimal, cut off rather than carried up, so that less
/// than what was asked for never reads as all of it.
[[nodiscard]] std::string printSize(std::uint64_t bytes);

}  // namespace spacekeep::ctl
