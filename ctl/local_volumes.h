// Thread safety: for one thread.
//
// The local volumes as several commands look at them: those of this machine, by the thresholds of
// the daemon.
#pragma once

#include <optional>
#include <string>

#include "ctl/complaint.h"
#include "ctl/survey.h"
#include "ctl/volume_report.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

/// Waits three seconds for a daemon that does not answer; then, and without a daemon, the thresholds
/// are the defaults, which is said in a remark. `state` gets the daemon's settings.
[[nodiscard]] VolumeReport localVolumes(const CommonOptions& common, Dictionary* state = nullptr);

/// Takes the other volumes out, unless `volume` is empty. Answers what is wrong with it.
[[nodiscard]] std::optional<std::string> keepOnly(const std::string& volume, VolumeReport& report);

/// surveyOffers() over a connection of its own, with progress on a terminal.
[[nodiscard]] Survey surveyShowing(const CommonOptions& common, const VolumeReport& report);

}  // namespace spacekeep::ctl
