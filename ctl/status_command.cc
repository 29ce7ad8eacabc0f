#include <fmt/core.h>
#include <unistd.h>

#include "ctl/commands.h"
#include "ctl/local_volumes.h"
#include "ctl/status_report.h"

namespace spacekeep::ctl {

ExitCode runStatus(const CommonOptions& common, const OneVolumeOptions& options) {
  StatusReport report{.volumes = localVolumes(common), .survey = {}};
  if (const auto objection = keepOnly(options.volume, report.volumes)) {
    return complain(common, ExitCode::kRefused, *objection);
  }
  report.survey = surveyShowing(common, report.volumes);
  fmt::print("{}", common.json ? jsonOf(report) + "\n" : textOf(report, styleOf(STDOUT_FILENO)));
  if (!report.survey.problem) return ExitCode::kDone;
  remark("what could be freed is not known: " + report.survey.problem->text);
  return report.survey.problem->code;
}

}  // namespace spacekeep::ctl
