// Thread safety: pure functions over descriptors.
//
// What stands under a name of a directory, and whether it takes part.
#pragma once

#include <cstdint>
#include <string>

#include "services/cachedir/engine/file_facts.h"
#include "services/cachedir/engine/roots.h"

namespace spacekeep::cachedir {

/// Directories below a root; each costs a descriptor while a walk is inside.
inline constexpr std::size_t kMaxDepth = 100;
/// Longest path below a root, in bytes, that openat2(2) takes in one step.
inline constexpr std::size_t kMaxPathBytes = 4000;

struct Entry {
  enum class Kind {
    kNothing,    // no such name (any more)
    kFile,       // regular
    kDirectory,  // of this mount or another one
    kOther,      // a link, a pipe, a file that is mounted here
    kFailed,     // the file system refused to tell
  };
  Kind kind = Kind::kNothing;
  std::uint64_t device = 0;
  FileState state;  // of files; of directories the inode alone
};

/// Does not follow links.
[[nodiscard]] Entry entryAt(int folder_fd, const char* name, const Root& root);

/// "." or "..".
[[nodiscard]] bool isDotName(const char* name);

/// Whether a directory of that path below its root is one too many directories down.
[[nodiscard]] bool isTooDeep(const std::string& path);

}  // namespace spacekeep::cachedir
