#include <fmt/core.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/text_layout.h"
#include "ctl/volume_report.h"
#include "support/volumes/linux/linux_volumes.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::ctl {
namespace {

/// The volumes are shown without a daemon too, so one that hangs must not keep them back.
constexpr std::chrono::milliseconds kPatience{3'000};

void printNames(const std::vector<VolumeSample>& samples) {
  for (const auto& sample : samples) fmt::print("{}\n", harmless(sample.volume));
}

}  // namespace

ExitCode runVolumes(const CommonOptions& common, const VolumesOptions& options) {
  LinuxVolumes volumes;
  if (options.names) {
    printNames(volumes.sampleLocalVolumes());
    return ExitCode::kDone;
  }
  VolumeReport report;
  auto state = wholeState(common, kPatience);
  if (state) {
    volumes.setLowSpaceSettings(lowSpaceSettingsFrom(*state, remark));
  } else {
    report.default_thresholds = true;
    remark("the thresholds are the defaults: " + state.error().text);
  }
  report.volumes = volumes.sampleLocalVolumes();
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : blocksOf(report, styleOf(STDOUT_FILENO)));
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
