// Thread safety: every function may be called from any thread.
//
// What the tool itself sees of a volume.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

namespace spacekeep::ctl {

struct MeasuredSpace {
  std::uint64_t size_bytes = 0;
  std::uint64_t free_bytes = 0;  ///< what an unprivileged writer can still use
  bool operator==(const MeasuredSpace&) const = default;
};

/// Of the file system of `path` (statvfs(3)); none when it cannot be asked from here.
[[nodiscard]] std::optional<MeasuredSpace> measuredSpaceOf(const std::string& path);

/// Shells complete a directory with a slash; the mount table knows the volume without it.
[[nodiscard]] std::string withoutTrailingSlashes(std::string path);

}  // namespace spacekeep::ctl
