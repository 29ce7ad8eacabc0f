#include "ctl/volume_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/supply.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kGap = 2;

std::string linesOf(const Supply& supply, const Style& style) {
  const std::string thresholds = fmt::format(
      "low below {}, very low below {}", supply.print(supply.low), supply.print(supply.very_low));
  return supplyLine(supply, style) +
         coloured(wrapped(thresholds, style.columns, kSupplyLabel), Colour::kFaint, style) + "\n";
}

std::string headOf(const VolumeSample& sample, const Style& style) {
  const std::string word = wordOf(sample.level);
  const std::size_t room = style.columns - std::min(style.columns, word.size() + kGap);
  const std::string volume = harmless(sample.volume);
  const std::string name = style.terminal ? shortened(volume, room) : volume;
  return name + std::string(kGap, ' ') + coloured(word, colourOf(sample.level), style) + "\n";
}

}  // namespace

std::string blocksOf(const VolumeReport& report, const Style& style) {
  if (report.volumes.empty()) return "There is no local volume here.\n";
  std::string text;
  for (const auto& sample : report.volumes) {
    if (!text.empty()) text += "\n";
    text += headOf(sample, style);
    for (const auto& supply : suppliesOf(sample)) text += linesOf(supply, style);
  }
  return text;
}

std::string jsonOf(const VolumeReport& report) {
  Array volumes;
  for (const auto& sample : report.volumes) volumes.emplace_back(jsonMembersOf(sample));
  return jsonOf(Value(Dictionary{{"volumes", std::move(volumes)},
                                 {"default_thresholds", report.default_thresholds}}));
}

}  // namespace spacekeep::ctl
