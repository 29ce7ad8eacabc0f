#include <fmt/core.h>
#include <unistd.h>

#include <cerrno>
#include <map>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "ctl/commands.h"
#include "ctl/explanation.h"
#include "ctl/json_text.h"
#include "ctl/local_volumes.h"
#include "ctl/past.h"
#include "ctl/status_report.h"
#include "ctl/supply.h"
#include "operations/info_keys.h"
#include "support/linux/linux_paths.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

/// Also a directory that this user cannot look into hides what is in it.
bool isMissing(const std::string& path) {
  return ::access(path.c_str(), F_OK) != 0 && errno == ENOENT;
}

std::map<std::string, std::string> missingSockets(
    const std::map<std::string, DeclaredService>& declared) {
  std::map<std::string, std::string> missing;
  for (const auto& [id, service] : declared) {
    const std::string socket = socketOf(LinuxPaths().services_directory, id);
    if (!socket.empty() && isMissing(socket)) missing.emplace(id, socket);
  }
  return missing;
}

std::vector<VolumeFacts> factsOf(const VolumeReport& report, const Survey& survey,
                                 const Dictionary& state, const Past& past) {
  const Date now{rt::wallClockNs()};
  const auto declared = servicesById(readDeclarations(""));
  const auto missing = missingSockets(declared);
  std::vector<VolumeFacts> facts;
  for (const auto& sample : report.volumes) {
    const VolumeOffers* offers = offersFor(survey, sample.volume);
    facts.push_back({.sample = sample,
                     .settings = lowSpaceSettingsFrom(state, [](const std::string&) {}),
                     .finish_early = truthAt(state, keys::kFinishEarly),
                     .offers = offers == nullptr ? VolumeOffers() : *offers,
                     .declared = declared,
                     .missing_sockets = missing});
    const auto done = past.find(sample.volume);
    if (done != past.end()) facts.back().past = pastParagraphs(done->second, now, localWords());
  }
  return facts;
}

std::string allJson(const std::vector<VolumeFacts>& facts,
                    const std::optional<SurveyProblem>& problem) {
  Array volumes;
  for (const auto& one : facts) {
    Array sentences;
    for (const auto& paragraph : explanationOf(one)) sentences.emplace_back(paragraph.text);
    volumes.emplace_back(Dictionary{{"volume", one.sample.volume},
                                    {"state", wordOf(one.sample.level)},
                                    {"explanation", std::move(sentences)}});
  }
  Dictionary object{{"volumes", std::move(volumes)}};
  if (problem) object.set("why_incomplete", problem->text);
  return jsonOf(Value(std::move(object)));
}

std::string allText(const std::vector<VolumeFacts>& facts, const Style& style) {
  if (facts.empty()) return "There is no local volume here.\n";
  std::string text;
  for (const auto& one : facts) {
    if (!text.empty()) text += "\n";
    text += textOf(explanationOf(one), style);
  }
  return text;
}

}  // namespace

ExitCode runExplain(const CommonOptions& common, const OneVolumeOptions& options) {
  Dictionary state;
  VolumeReport report = localVolumes(common, &state);
  if (const auto objection = keepOnly(options.volume, report)) {
    return complain(common, ExitCode::kRefused, *objection);
  }
  const Survey survey = surveyShowing(common, report);
  const auto facts = factsOf(report, survey, state, pastOf(common, report));
  fmt::print("{}", common.json ? allJson(facts, survey.problem) + "\n"
                               : allText(facts, styleOf(STDOUT_FILENO)));
  if (!survey.problem) return ExitCode::kDone;
  remark("what could be freed is not known: " + survey.problem->text);
  return survey.problem->code;
}

}  // namespace spacekeep::ctl
