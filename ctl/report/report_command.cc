#include <fmt/core.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <string>
#include <utility>

#include "ctl/commands.h"
#include "ctl/daemon_link.h"
#include "ctl/history/pages.h"
#include "ctl/json_text.h"
#include "ctl/local_volumes.h"
#include "ctl/report/html_page.h"
#include "ctl/report/page_file.h"
#include "ctl/report/report_data.h"
#include "ctl/text_layout.h"
#include "ctl/volume_space.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

std::string hostName() {
  std::array<char, 256> name = {};
  return gethostname(name.data(), name.size() - 1) == 0 ? name.data() : "";
}

bool offersAreKnown(const Survey& survey) {
  return std::ranges::any_of(survey.volumes, [](const VolumeOffers& offers) {
    return offers.detail != VolumeOffers::Detail::kNothing;
  });
}

/// What is missing, of what the daemon alone can tell; those that say the same are said once.
std::vector<SurveyProblem> problemsOf(const ReportData& data) {
  std::vector<SurveyProblem> problems;
  if (const auto& problem = data.history.problem) {
    problems.push_back({problem->code, "what was freed is not known: " + problem->text});
  }
  if (const auto& problem = data.status.survey.problem) {
    problems.push_back({problem->code, "what could be freed is not known: " + problem->text});
  }
  return problems;
}

void sayDone(const CommonOptions& common, const ReportOptions& options, const ReportData& data) {
  const std::size_t volumes = data.status.volumes.volumes.size();
  const std::size_t entries = data.history.entries.size();
  if (options.file == kStandardOutput) return;
  if (common.json) {
    const Dictionary object{{"file", options.file}, {"volumes", volumes}, {"entries", entries}};
    fmt::print("{}\n", jsonOf(Value(object)));
  } else {
    fmt::print("{}: {} volume{}, {} entr{} of the history\n", harmless(options.file), volumes,
               volumes == 1 ? "" : "s", printCount(entries), entries == 1 ? "y" : "ies");
  }
}

ExitCode finish(const CommonOptions& common, const ReportOptions& options, const ReportData& data) {
  const auto problems = problemsOf(data);
  if (data.history.access != History::Access::kRead && !offersAreKnown(data.status.survey) &&
      !problems.empty()) {
    // A page that tells nothing must not take the place of one that does.
    return complain(common, problems.back().code, problems.back().text + "; nothing was written");
  }
  if (const auto problem = writePage(options.file, pageWith(jsonOf(data)))) {
    return complain(common, ExitCode::kFailed, *problem);
  }
  sayDone(common, options, data);
  for (const auto& problem : problems) remark(problem.text);
  const auto failed = std::ranges::find_if(
      problems, [](const SurveyProblem& problem) { return problem.code != ExitCode::kDone; });
  return failed == problems.end() ? ExitCode::kDone : failed->code;
}

std::optional<std::string> objectionTo(const CommonOptions& common, const ReportOptions& options) {
  if (common.json && options.file == kStandardOutput) {
    return "--json and --html - both want standard output; name a file";
  }
  return objectionToFile(options.file);
}

}  // namespace

ExitCode runReport(const CommonOptions& common, const ReportOptions& options) {
  if (const auto objection = objectionTo(common, options)) {
    return complain(common, ExitCode::kUsage, *objection);
  }
  auto client = connectTo(common);
  if (!client) return complain(common, client.error());
  ReportData data{
      .host = hostName(),
      .made_ns = rt::wallClockNs(),
      .wanted = {.volume = withoutTrailingSlashes(options.volume), .since_ns = options.since_ns},
      .status = {.volumes = localVolumes(common), .survey = {}},
      .history = {}};
  const auto not_here = keepOnly(options.volume, data.status.volumes);
  data.history = readHistory(data.wanted, historyOver(*client));
  // What was unplugged since may still have a past.
  if (not_here && data.history.entries.empty()) {
    return complain(common, ExitCode::kRefused, *not_here);
  }
  data.status.survey = surveyShowing(common, data.status.volumes);
  return finish(common, options, data);
}

}  // namespace spacekeep::ctl
