// Thread safety: pure functions over the file system.
//
// Directories that were renamed because they were to go as a whole, and that a cancel or a crash
// left under the new name.
#pragma once

#include <string>
#include <string_view>
#include <vector>

namespace spacekeep::command {

/// In front of the name of a directory that is going, while it is looked at for the last time. What
/// a crash left is looked at again first.
inline constexpr const char* kGoingPrefix = ".spacekeep-going-";
/// The same once it has passed: a part of it may be gone, so it never gets its name back.
inline constexpr const char* kHalfPrefix = ".spacekeep-half-";

struct LeftOver {
  std::string prefix;
  std::string name;  // that it had
};

/// Whether a directory of that name is one, whatever a pattern says.
[[nodiscard]] bool isLeftOver(std::string_view name);

/// Those in the directory `folder_fd` whose names `pattern` (the last component of a rule's path)
/// stood for, at most kMaxMatches. The halves come first, because one is in
/// the way of another left over of the same name.
[[nodiscard]] std::vector<LeftOver> leftOversIn(int folder_fd, const std::string& pattern);

}  // namespace spacekeep::command
