#include <fmt/core.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/local_volumes.h"
#include "ctl/past.h"
#include "ctl/status_report.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

std::map<std::string, VolumePast> pastShown(const CommonOptions& common,
                                            const VolumeReport& volumes) {
  std::map<std::string, VolumePast> shown;
  const HistoryWords words = localWords();
  const Date now{rt::wallClockNs()};
  for (const auto& [volume, entries] : pastOf(common, volumes)) {
    VolumePast& past = shown[volume];
    for (const HistoryEntry& entry : entries) {
      past.sentences.push_back(sentenceOf(entry, now, words));
      past.entries.push_back(jsonMembersOf(entry, words));
    }
  }
  return shown;
}

}  // namespace

ExitCode runStatus(const CommonOptions& common, const OneVolumeOptions& options) {
  StatusReport report{.volumes = localVolumes(common), .survey = {}};
  if (const auto objection = keepOnly(options.volume, report.volumes)) {
    return complain(common, ExitCode::kRefused, *objection);
  }
  report.survey = surveyShowing(common, report.volumes);
  report.past = pastShown(common, report.volumes);
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : textOf(report, styleOf(STDOUT_FILENO)));
  if (!report.survey.problem) return ExitCode::kDone;
  remark("what could be freed is not known: " + report.survey.problem->text);
  return report.survey.problem->code;
}

}  // namespace spacekeep::ctl
