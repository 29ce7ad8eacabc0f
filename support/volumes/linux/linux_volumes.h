// Thread safety: every member may be called from any thread.
//
// The volumes of this machine.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "support/runtime/guarded.h"
#include "support/volumes/linux/mount_table.h"
#include "support/volumes/low_space_memory.h"
#include "support/volumes/space_source.h"
#include "support/volumes/volumes.h"

namespace spacekeep {

class LinuxVolumes final : public Volumes, public SpaceSource {
 public:
  explicit LinuxVolumes(std::string mount_table_path = "/proc/self/mountinfo")
      : table_(std::move(mount_table_path)) {}

  [[nodiscard]] std::vector<std::string> getLocalVolumes() override;
  [[nodiscard]] std::vector<std::string> lowSpaceVolumes() override;
  /// True when "SPACEKEEP_VOLUME" is exactly the mount point of a local volume, also of one that is
  /// mounted a second time there. A path that only means the same ("/data/", "/data/.") does not
  /// name it: volumes are compared as texts everywhere.
  [[nodiscard]] bool validateVolume(const Dictionary& info) override;
  [[nodiscard]] std::uint64_t volumeFreespace(const Value* volume) override;

  void setLowSpaceSettings(const LowSpaceSettings& settings) override;

  [[nodiscard]] std::vector<VolumeSample> sampleLocalVolumes() override;
  void setThresholdsChangedHandler(std::function<void()> changed) override;

  /// How often the mount table was read so far.
  [[nodiscard]] std::uint64_t mountTableReadings() const { return table_.readings(); }

 private:
  MountTable table_;
  LowSpaceMemory memory_;
  rt::Guarded<std::function<void()>> thresholds_changed_;
};

}  // namespace spacekeep
