// Thread safety: every member may be called from any thread.
//
// Volumes and free space as the operations see them. A volume is the path string of a mount point.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "support/values/value.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep {

class Volumes {
 public:
  virtual ~Volumes() = default;

  /// Mounted local volumes, each file system once, in mount order.
  [[nodiscard]] virtual std::vector<std::string> getLocalVolumes() = 0;
  /// Those that are short of free space or inodes now.
  [[nodiscard]] virtual std::vector<std::string> lowSpaceVolumes() = 0;
  /// Whether the request's "SPACEKEEP_VOLUME" names a mounted local volume.
  [[nodiscard]] virtual bool validateVolume(const Dictionary& info) = 0;
  /// Bytes that an unprivileged writer can still use; 0 for an absent or unknown volume.
  [[nodiscard]] virtual std::uint64_t volumeFreespace(const Value* volume) = 0;
  /// From the next look at the volumes on, which comes at once.
  virtual void setLowSpaceSettings(const LowSpaceSettings& settings) = 0;

  /// Bytes by which the free space of "SPACEKEEP_VOLUME" has grown since
  /// "SPACEKEEP_FREESPACE_BEGIN"; never negative.
  [[nodiscard]] std::uint64_t amountPurged(const Dictionary& request);
};

}  // namespace spacekeep
