#include "ctl/status_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/past.h"
#include "ctl/size_text.h"
#include "ctl/supply.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kGap = 2;

/// Elsewhere than on a terminal a line stays one line.
std::string fitted(const std::string& line, const Style& style) {
  return (style.terminal ? wrapped(line, style.columns, 0) : line) + "\n";
}

std::string headOf(const VolumeSample& sample, const Style& style) {
  const std::string word = coloured(wordOf(sample.level), colourOf(sample.level), style);
  const std::string shortage = shortageOf(sample);
  const std::size_t plain = std::string_view(wordOf(sample.level)).size();
  const std::string volume = harmless(sample.volume);
  const std::string name =
      style.terminal ? shortened(volume, style.columns - std::min(style.columns, plain + kGap + 1))
                     : volume;
  const std::string head = name + std::string(kGap, ' ') + word;
  if (shortage.empty()) return head + "\n";
  const std::size_t used = displayWidth(name) + kGap + plain + kGap + shortage.size();
  if (!style.terminal || used <= style.columns) return head + ": " + shortage + "\n";
  return head + ":\n" + wrapped(shortage, style.columns, kGap) + "\n";
}

std::string blockOf(const VolumeSample& sample, const StatusReport& report, const Style& style) {
  std::string text = headOf(sample, style);
  for (const auto& supply : suppliesOf(sample)) text += supplyLine(supply, style);
  const VolumeOffers* offers = offersFor(report.survey, sample.volume);
  if (offers != nullptr) text += offersText(*offers, style);
  const auto past = report.past.find(sample.volume);
  if (past != report.past.end()) text += pastLines(past->second.sentences, style);
  return text;
}

std::string shortOnes(const std::vector<VolumeSample>& volumes) {
  const auto count = std::ranges::count_if(
      volumes, [](const VolumeSample& sample) { return sample.level != SpaceLevel::kEnough; });
  if (volumes.size() == 1) return count == 0 ? "not short of space" : "short of space";
  return count == 0 ? "none of them short of space"
                    : fmt::format("{} of them short of space", count);
}

std::string closingLine(const StatusReport& report) {
  const auto& volumes = report.volumes.volumes;
  std::string line = fmt::format("{} volume{}, {}", volumes.size(), volumes.size() == 1 ? "" : "s",
                                 shortOnes(volumes));
  std::int64_t usual = 0;
  std::int64_t most = 0;
  bool known = false;
  for (const auto& offers : report.survey.volumes) {
    if (offers.detail == VolumeOffers::Detail::kNothing) continue;
    known = true;
    usual += totalAt(offers, kDefaultUrgency);
    most += totalAt(offers, kUrgencies);
  }
  if (!known) return line;
  return line + fmt::format("; {} could be freed at urgency {}, the default, and {} at urgency {}",
                            printSignedSize(usual), kDefaultUrgency, printSignedSize(most),
                            kUrgencies);
}

bool somebodyWasLate(const Survey& survey) {
  return std::ranges::any_of(survey.volumes, &VolumeOffers::somebody_was_late);
}

const char* detailWord(VolumeOffers::Detail detail) {
  switch (detail) {
    case VolumeOffers::Detail::kNothing:
      return "nothing";
    case VolumeOffers::Detail::kTotals:
      return "totals";
    case VolumeOffers::Detail::kServices:
      return "services";
  }
  return "";
}

Value servicesAt(const VolumeOffers& offers, std::size_t index) {
  Array services;
  for (const auto& service : offers.services) {
    Dictionary entry{{"id", service.id}};
    if (service.bytes[index]) entry.set("bytes", *service.bytes[index]);
    services.emplace_back(std::move(entry));
  }
  return services;
}

Value valueOf(const VolumeOffers& offers) {
  Dictionary value{{"detail", detailWord(offers.detail)}};
  if (offers.detail == VolumeOffers::Detail::kNothing) return value;
  Array urgencies;
  for (std::size_t i = 0; i < kUrgencies; ++i) {
    Dictionary urgency{{"urgency", static_cast<int>(i) + 1},
                       {"total_bytes", offers.total_bytes[i]}};
    if (offers.detail == VolumeOffers::Detail::kServices) {
      urgency.set("services", servicesAt(offers, i));
    }
    urgencies.emplace_back(std::move(urgency));
  }
  value.set("urgencies", std::move(urgencies));
  value.set("somebody_was_late", offers.somebody_was_late);
  return value;
}

Value shortOf(const VolumeSample& sample) {
  Array labels;
  for (const auto& supply : suppliesOf(sample)) {
    if (levelOf(supply) != SpaceLevel::kEnough) labels.emplace_back(supply.label);
  }
  return labels;
}

}  // namespace

std::string shortageOf(const VolumeSample& sample) {
  std::string text;
  for (const auto& supply : suppliesOf(sample)) {
    const SpaceLevel level = levelOf(supply);
    if (level == SpaceLevel::kEnough) continue;
    const auto threshold = level == SpaceLevel::kVeryLow ? supply.very_low : supply.low;
    const bool space = supply.print == printSize;
    text += text.empty() ? "" : ", ";
    text += fmt::format("{} {}{} free", space ? "less than" : "fewer than", supply.print(threshold),
                        space ? "" : " inodes");
  }
  return text;
}

const VolumeOffers* offersFor(const Survey& survey, const std::string& volume) {
  const auto found = std::ranges::find(survey.volumes, volume, &VolumeOffers::volume);
  return found == survey.volumes.end() ? nullptr : &*found;
}

// Blocks first, then what is true of all volumes.
std::string textOf(const StatusReport& report, const Style& style) {
  if (report.volumes.volumes.empty()) return "There is no local volume here.\n";
  std::string text;
  for (const auto& sample : report.volumes.volumes) {
    text += blockOf(sample, report, style) + "\n";
  }
  text += fitted(closingLine(report), style);
  if (somebodyWasLate(report.survey)) {
    text += fitted(
        "somebody took longer to answer than the daemon waits and may be missing; asked "
        "again within two minutes, its answer is there",
        style);
  }
  return text;
}

Array volumesValueOf(const StatusReport& report) {
  Array volumes;
  for (const auto& sample : report.volumes.volumes) {
    Dictionary members = jsonMembersOf(sample);
    members.set("short_of", shortOf(sample));
    const VolumeOffers* offers = offersFor(report.survey, sample.volume);
    members.set("offers", offers == nullptr ? valueOf(VolumeOffers{}) : valueOf(*offers));
    const auto past = report.past.find(sample.volume);
    if (past != report.past.end()) members.set("past", past->second.entries);
    volumes.emplace_back(std::move(members));
  }
  return volumes;
}

std::string jsonOf(const StatusReport& report) {
  Dictionary object{{"volumes", volumesValueOf(report)},
                    {"default_thresholds", report.volumes.default_thresholds}};
  if (report.survey.problem) object.set("why_incomplete", report.survey.problem->text);
  return jsonOf(Value(std::move(object)));
}

}  // namespace spacekeep::ctl
