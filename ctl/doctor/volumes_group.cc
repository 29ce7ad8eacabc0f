#include <fmt/core.h>
#include <unistd.h>

#include "ctl/doctor/groups.h"
#include "ctl/status_report.h"
#include "ctl/text_layout.h"
#include "support/volumes/linux/linux_volumes.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::ctl::doctor {
namespace {

void checkVolume(const VolumeSample& sample, Group& group) {
  const std::string volume = harmless(sample.volume);
  const std::string what_to_do = fmt::format("spacekeepctl explain {} tells what could go", volume);
  switch (sample.level) {
    case SpaceLevel::kEnough:
      return;
    case SpaceLevel::kLow:
      return group.advice("volume-low", fmt::format("{} is low: {}", volume, shortageOf(sample)),
                          what_to_do);
    case SpaceLevel::kVeryLow:
      return group.problem("volume-very-low",
                           fmt::format("{} is very low: {}", volume, shortageOf(sample)),
                           what_to_do);
  }
}

}  // namespace

Group volumesGroupOf(const std::vector<VolumeSample>& samples) {
  Group group{.name = "volumes"};
  if (samples.empty()) {
    group.problem("no-volume", "there is no local volume, so there is nothing to look after",
                  "see which file systems there are: findmnt");
    return group;
  }
  for (const auto& sample : samples) checkVolume(sample, group);
  if (group.isFine()) {
    group.ok("volumes",
             samples.size() == 1
                 ? fmt::format("{} is not short of space", harmless(samples[0].volume))
                 : fmt::format("none of the {} volumes is short of space", samples.size()));
  }
  return group;
}

Group volumesGroup(const Place& place, const Contact& contact) {
  if (::access(place.paths.mount_table.c_str(), R_OK) != 0) {
    Group group{.name = "volumes"};
    group.unseen("volumes", fmt::format("{} cannot be read", place.paths.mount_table));
    return group;
  }
  LinuxVolumes volumes(place.paths.mount_table);
  volumes.setLowSpaceSettings(lowSpaceSettingsFrom(contact.state, [](const std::string&) {}));
  return volumesGroupOf(volumes.sampleLocalVolumes());
}

}  // namespace spacekeep::ctl::doctor
