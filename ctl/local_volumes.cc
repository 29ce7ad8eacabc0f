#include "ctl/local_volumes.h"

#include <fmt/core.h>
#include <unistd.h>

#include <cstdio>
#include <vector>

#include "ctl/daemon_link.h"
#include "ctl/renewed_line.h"
#include "ctl/shown_call.h"
#include "ctl/text_layout.h"
#include "ctl/volume_space.h"
#include "support/runtime/runtime.h"
#include "support/volumes/linux/linux_volumes.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::ctl {
namespace {

/// The volumes are shown without a daemon too, so one that hangs must not keep them back.
constexpr std::chrono::milliseconds kPatience{3'000};

}  // namespace

VolumeReport localVolumes(const CommonOptions& common, Dictionary* state) {
  LinuxVolumes volumes;
  VolumeReport report;
  auto found = wholeState(common, kPatience);
  if (found) {
    volumes.setLowSpaceSettings(lowSpaceSettingsFrom(*found, remark));
    if (state != nullptr) *state = *found;
  } else {
    report.default_thresholds = true;
    remark("the thresholds are the defaults: " + found.error().text);
  }
  report.volumes = volumes.sampleLocalVolumes();
  return report;
}

std::optional<std::string> keepOnly(const std::string& volume, VolumeReport& report) {
  if (volume.empty()) return std::nullopt;
  const std::string wanted = withoutTrailingSlashes(volume);
  std::erase_if(report.volumes,
                [&](const VolumeSample& sample) { return sample.volume != wanted; });
  if (!report.volumes.empty()) return std::nullopt;
  return fmt::format(
      "{} is not the mount point of a local volume (spacekeepctl volumes --names "
      "lists them)",
      harmless(wanted));
}

Survey surveyShowing(const CommonOptions& common, const VolumeReport& report) {
  auto client = connectTo(common);
  if (!client) {
    return {.volumes = {},
            .problem = SurveyProblem{exitCodeOf(client.error().kind), client.error().text}};
  }
  std::vector<std::string> names;
  for (const auto& sample : report.volumes) names.push_back(sample.volume);
  const Style style = styleOf(STDERR_FILENO);
  RenewedLine line(style.terminal && !common.json ? stderr : nullptr, style.columns);
  const std::uint64_t start_ticks = rt::ticks();
  return surveyOffers(*client, names, [&](const std::string& volume, int urgency) {
    const auto text = surveyProgressText(volume, urgency, secondsSince(start_ticks));
    if (text) line.show(*text);
  });
}

}  // namespace spacekeep::ctl
