// Thread safety: pure functions over plain values.
//
// The local volumes and how near they are to being short of space, for people and programs.
#pragma once

#include <string>
#include <vector>

#include "ctl/style.h"
#include "support/volumes/space_source.h"

namespace spacekeep::ctl {

struct VolumeReport {
  std::vector<VolumeSample> volumes;
  bool default_thresholds = false;  ///< the daemon could not be asked for its settings
};

/// A block of lines per volume: space, and inodes where the file system counts them.
[[nodiscard]] std::string blocksOf(const VolumeReport& report, const Style& style);
/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const VolumeReport& report);

}  // namespace spacekeep::ctl
