#include <fmt/core.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/local_volumes.h"
#include "ctl/text_layout.h"
#include "support/volumes/linux/linux_volumes.h"

namespace spacekeep::ctl {
namespace {

void printNames(const std::vector<VolumeSample>& samples) {
  for (const auto& sample : samples) fmt::print("{}\n", harmless(sample.volume));
}

}  // namespace

ExitCode runVolumes(const CommonOptions& common, const VolumesOptions& options) {
  if (options.names) {
    printNames(LinuxVolumes().sampleLocalVolumes());
    return ExitCode::kDone;
  }
  const VolumeReport report = localVolumes(common);
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : blocksOf(report, styleOf(STDOUT_FILENO)));
  return ExitCode::kDone;
}

}  // namespace spacekeep::ctl
