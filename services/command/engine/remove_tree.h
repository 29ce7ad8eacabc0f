// Thread safety: pure function over the file system.
//
// Removes a directory with all that is in it, by descriptors, and never what is mounted inside or what
// a symbolic link names.
#pragma once

#include <cstdint>

#include "services/cachedir/engine/cancel_token.h"

namespace spacekeep::command {

struct Removed {
  /// False when something stayed: an error, another mount, more than 100 directories deep, or a
  /// cancel; a later call goes on.
  bool all = false;
  /// That come back: of files whose last name this call took, and nobody else.
  std::uint64_t bytes = 0;
};

/// `name` in the directory `folder_fd`.
[[nodiscard]] Removed removeTree(int folder_fd, const char* name,
                                 const cachedir::CancelToken& cancel);

}  // namespace spacekeep::command
