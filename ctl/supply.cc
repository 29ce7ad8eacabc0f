#include "ctl/supply.h"

#include <fmt/core.h>

#include <algorithm>

#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kGap = 2;
constexpr std::size_t kMostBarCells = 30;
constexpr std::size_t kFewestBarCells = 10;

Supply spaceOf(const VolumeSample& sample) {
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

std::string usedBar(const Supply& supply, std::size_t cells, const Style& style) {
  const auto whole = static_cast<double>(supply.whole);
  const auto used = whole - static_cast<double>(std::min(supply.available, supply.whole));
  return coloured(bar(whole > 0 ? used / whole : 0, cells, style), colourOf(levelOf(supply)),
                  style);
}

}  // namespace

std::vector<Supply> suppliesOf(const VolumeSample& sample) {
  std::vector<Supply> supplies{spaceOf(sample)};
  if (sample.space.inodes > 0) supplies.push_back(inodesOf(sample));
  return supplies;
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

std::string numbersOf(const Supply& supply) {
  return fmt::format("{} free of {}", supply.print(supply.available), supply.print(supply.whole));
}

std::string supplyLine(const Supply& supply, const Style& style) {
  const std::string label = padded(fmt::format("  {}", supply.label), kSupplyLabel);
  const std::string numbers = numbersOf(supply);
  const std::size_t used = kSupplyLabel + kGap + numbers.size();
  const std::size_t rest = style.columns > used ? style.columns - used : 0;
  if (rest >= kFewestBarCells) {
    return label + usedBar(supply, std::min(rest, kMostBarCells), style) + std::string(kGap, ' ') +
           numbers + "\n";
  }
  const std::size_t cells = std::min(style.columns - kSupplyLabel, kMostBarCells);
  return label + usedBar(supply, cells, style) + "\n" + std::string(kSupplyLabel, ' ') + numbers +
         "\n";
}

Dictionary jsonMembersOf(const VolumeSample& sample) {
  return {{"volume", sample.volume},
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

}  // namespace spacekeep::ctl
