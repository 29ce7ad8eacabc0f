// Thread safety: pure functions over descriptors.
//
// Opening by name without ever leaving the place one stands in (openat2(2)).
#pragma once

#include <optional>
#include <string>

#include "services/cachedir/engine/unique_fd.h"

namespace spacekeep::cachedir {

/// Opens `path` below the directory `folder_fd`: no symbolic link in any component, no step above
/// the directory, no step onto another mount. `flags` as of open(2); O_CLOEXEC is added.
/// Not open on failure, with errno set.
[[nodiscard]] UniqueFd openBeneath(int folder_fd, const char* path, int flags);

/// Opens the absolute `path` of a directory, refusing symbolic links in any component.
[[nodiscard]] UniqueFd openDirectoryWithoutLinks(const std::string& path);

/// "No such file or directory (ENOENT)".
[[nodiscard]] std::string errnoText(int error);

}  // namespace spacekeep::cachedir
