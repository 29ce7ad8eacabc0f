// Thread safety: for one thread.
//
// Where a page goes: a file that is whole or not there, or standard output.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace spacekeep::ctl {

/// "-" is standard output.
inline constexpr const char* kStandardOutput = "-";

/// What is wrong with `path` as a file to be made or replaced, in words; none when nothing is. A
/// page takes a while to make, so this is looked at before.
[[nodiscard]] std::optional<std::string> objectionToFile(const std::string& path);

/// Replaces the file as a whole, or leaves it as it was and answers what went wrong. A symbolic link
/// stays one: what it names is replaced. A new file has the mode that the umask leaves of 0666.
[[nodiscard]] std::optional<std::string> writePage(const std::string& path, std::string_view text);

}  // namespace spacekeep::ctl
