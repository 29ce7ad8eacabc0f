// Thread safety: pure function over the file system.
//
// The owner's word against any rule.
#pragma once

#include <unistd.h>

#include <string>

namespace spacekeep::command {

/// A directory that holds a file of this name is left alone, with everything in it. Looked for in
/// each directory that a rule's PATH stands for.
inline constexpr const char* kOptOutMarker = ".spacekeep-keep";

/// Whether the marker is in the directory `name` of the directory `folder_fd` (or AT_FDCWD).
[[nodiscard]] inline bool isOptedOut(int folder_fd, const std::string& name) {
  return ::faccessat(folder_fd, (name + "/" + kOptOutMarker).c_str(), F_OK, 0) == 0;
}

}  // namespace spacekeep::command
