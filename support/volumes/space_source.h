// Thread safety: every member may be called from any thread.
//
// A look at the space of all local volumes at once, for whoever watches them.
#pragma once

#include <functional>
#include <string>
#include <vector>

#include "support/volumes/low_space.h"

namespace spacekeep {

struct VolumeSample {
  std::string volume = {};        ///< mount point
  std::uint64_t file_system = 0;  ///< tells apart what was mounted there one after another
  VolumeSpace space = {};
  SpaceThresholds thresholds = {};
  SpaceLevel level = SpaceLevel::kEnough;
};

class SpaceSource {
 public:
  virtual ~SpaceSource() = default;
  /// Every local volume, each file system once, in mount order. A volume that cannot be asked is
  /// left out.
  [[nodiscard]] virtual std::vector<VolumeSample> sampleLocalVolumes() = 0;

  /// `changed` is called when the thresholds have changed, so that waiting for the next look would
  /// miss what is short now; it must return soon and not come back here. There is one, an empty one
  /// takes it away: when this returns, the one before is not running and will not be called.
  virtual void setThresholdsChangedHandler(std::function<void()> changed) = 0;
};

}  // namespace spacekeep
