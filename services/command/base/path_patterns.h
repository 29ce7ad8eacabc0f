// Thread safety: pure functions over the file system.
//
// Directories by a pattern: programs name their profiles and versions as they like.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace spacekeep::command {

inline constexpr std::size_t kMaxMatches = 4096;

/// Whether some component of the path holds "*", "?" or "[".
[[nodiscard]] bool isPattern(const std::string& path);

/// The directories that an absolute path stands for, in the order of their names; a path without a
/// pattern stands for itself, there or not. A component that is a pattern (fnmatch(3)) matches names
/// of real directories, not of symbolic links; a leading dot must be written. At most kMaxMatches.
[[nodiscard]] std::vector<std::string> matchesOf(const std::string& path);

}  // namespace spacekeep::command
