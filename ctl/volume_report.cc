#include "ctl/volume_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kLabel = 10;  // "  inodes  "
constexpr std::size_t kGap = 2;
constexpr std::size_t kMostBarCells = 30;
constexpr std::size_t kFewestBarCells = 10;

using Print = std::string (*)(std::uint64_t);

/// One thing that a volume can run out of.
struct Supply {
  const char* label;
  std::uint64_t whole;
  std::uint64_t available;
  std::uint64_t low;
  std::uint64_t very_low;
  Print print;
};

Supply bytesOf(const VolumeSample& sample) {
  return {"space",
          sample.space.size_bytes,
          sample.space.available_bytes,
          sample.thresholds.low_bytes,
          sample.thresholds.very_low_bytes,
          printSize};
}

Supply inodesOf(const VolumeSample& sample) {
  return {"inodes",
          sample.space.inodes,
          sample.space.available_inodes,
          sample.thresholds.low_inodes,
          sample.thresholds.very_low_inodes,
          printCount};
}

SpaceLevel levelOf(const Supply& supply) {
  if (supply.available < supply.very_low) return SpaceLevel::kVeryLow;
  return supply.available < supply.low ? SpaceLevel::kLow : SpaceLevel::kEnough;
}

const char* wordOf(SpaceLevel level) {
  switch (level) {
    case SpaceLevel::kEnough:
      return "ok";
    case SpaceLevel::kLow:
      return "low";
    case SpaceLevel::kVeryLow:
      return "very low";
  }
  return "";
}

Colour colourOf(SpaceLevel level) {
  switch (level) {
    case SpaceLevel::kEnough:
      return Colour::kGreen;
    case SpaceLevel::kLow:
      return Colour::kYellow;
    case SpaceLevel::kVeryLow:
      return Colour::kRed;
  }
  return Colour::kNone;
}

std::string usedBar(const Supply& supply, std::size_t cells, const Style& style) {
  const auto whole = static_cast<double>(supply.whole);
  const auto used = whole - static_cast<double>(std::min(supply.available, supply.whole));
  return coloured(bar(whole > 0 ? used / whole : 0, cells, style), colourOf(levelOf(supply)),
                  style);
}

/// Bar and numbers in one line, or below each other where there is no room.
std::string numbersOf(const Supply& supply, const Style& style) {
  const std::string numbers =
      fmt::format("{} free of {}", supply.print(supply.available), supply.print(supply.whole));
  const std::size_t used = kLabel + kGap + numbers.size();
  const std::size_t rest = style.columns > used ? style.columns - used : 0;
  if (rest >= kFewestBarCells) {
    return usedBar(supply, std::min(rest, kMostBarCells), style) + std::string(kGap, ' ') +
           numbers + "\n";
  }
  const std::size_t cells = std::min(style.columns - kLabel, kMostBarCells);
  return usedBar(supply, cells, style) + "\n" + std::string(kLabel, ' ') + numbers + "\n";
}

std::string linesOf(const Supply& supply, const Style& style) {
  const std::string thresholds = fmt::format(
      "low below {}, very low below {}", supply.print(supply.low), supply.print(supply.very_low));
  return padded(fmt::format("  {}", supply.label), kLabel) + numbersOf(supply, style) +
         coloured(wrapped(thresholds, style.columns, kLabel), Colour::kFaint, style) + "\n";
}

std::string headOf(const VolumeSample& sample, const Style& style) {
  const std::string word = wordOf(sample.level);
  const std::size_t room = style.columns - std::min(style.columns, word.size() + kGap);
  const std::string volume = harmless(sample.volume);
  const std::string name = style.terminal ? shortened(volume, room) : volume;
  return name + std::string(kGap, ' ') + coloured(word, colourOf(sample.level), style) + "\n";
}

Value valueOf(const VolumeSample& sample) {
  return Dictionary{{"volume", sample.volume},
                    {"state", wordOf(sample.level)},
                    {"size_bytes", sample.space.size_bytes},
                    {"free_bytes", sample.space.available_bytes},
                    {"low_bytes", sample.thresholds.low_bytes},
                    {"very_low_bytes", sample.thresholds.very_low_bytes},
                    {"inodes", sample.space.inodes},
                    {"free_inodes", sample.space.available_inodes},
                    {"low_inodes", sample.thresholds.low_inodes},
                    {"very_low_inodes", sample.thresholds.very_low_inodes}};
}

}  // namespace

std::string blocksOf(const VolumeReport& report, const Style& style) {
  if (report.volumes.empty()) return "There is no local volume here.\n";
  std::string text;
  for (const auto& sample : report.volumes) {
    if (!text.empty()) text += "\n";
    text += headOf(sample, style) + linesOf(bytesOf(sample), style);
    if (sample.space.inodes > 0) text += linesOf(inodesOf(sample), style);
  }
  return text;
}

std::string jsonOf(const VolumeReport& report) {
  Array volumes;
  for (const auto& sample : report.volumes) volumes.push_back(valueOf(sample));
  return jsonOf(Value(Dictionary{{"volumes", std::move(volumes)},
                                 {"default_thresholds", report.default_thresholds}}));
}

}  // namespace spacekeep::ctl
