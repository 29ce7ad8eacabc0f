// Thread safety: pure functions over plain values.
//
// How the volumes of this machine are, and what could be done about it, for people and programs.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "ctl/offers.h"
#include "ctl/style.h"
#include "ctl/survey.h"
#include "ctl/volume_report.h"

namespace spacekeep::ctl {

/// What was done last on a volume, newest first.
struct VolumePast {
  std::vector<std::string> sentences = {};
  Array entries = {};  ///< the same as objects
};

struct StatusReport {
  VolumeReport volumes;
  Survey survey;                                ///< of the same volumes, or of none
  std::map<std::string, VolumePast> past = {};  ///< by volume; nothing where nothing is known
};

/// What makes the volume short: "less than 500.0 MiB free", "fewer than 50,000 inodes free", both
/// with a comma between them. Empty when nothing does.
[[nodiscard]] std::string shortageOf(const VolumeSample& sample);

/// Null when the volume was not asked about.
[[nodiscard]] const VolumeOffers* offersFor(const Survey& survey, const std::string& volume);

/// A block per volume and a closing line; on a terminal fitted to its width.
[[nodiscard]] std::string textOf(const StatusReport& report, const Style& style);
/// The lines of one volume on who could give how much.
[[nodiscard]] std::string offersText(const VolumeOffers& offers, const Style& style);
/// An object per volume with its numbers and its offers; the man page of the tool describes them.
[[nodiscard]] Array volumesValueOf(const StatusReport& report);
/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const StatusReport& report);

}  // namespace spacekeep::ctl
