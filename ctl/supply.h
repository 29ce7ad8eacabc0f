// Thread safety: pure functions over plain values.
//
// What a volume can run out of, space and inodes, and how near it is to that.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

#include "ctl/style.h"
#include "support/values/value.h"
#include "support/volumes/space_source.h"

namespace spacekeep::ctl {

struct Supply {
  using Print = std::string (*)(std::uint64_t);

  const char* label;
  std::uint64_t whole;
  std::uint64_t available;
  std::uint64_t low;
  std::uint64_t very_low;
  Print print;
};

/// Space, and inodes where the file system counts them.
[[nodiscard]] std::vector<Supply> suppliesOf(const VolumeSample& sample);

/// Compared with the thresholds alone.
[[nodiscard]] SpaceLevel levelOf(const Supply& supply);

/// "ok", "low", "very low".
[[nodiscard]] const char* wordOf(SpaceLevel level);
[[nodiscard]] Colour colourOf(SpaceLevel level);

/// "400.0 MiB free of 100.0 GiB".
[[nodiscard]] std::string numbersOf(const Supply& supply);

/// Label, bar of what is used and numbers in one line, or bar and numbers below each other where
/// there is no room. Ends with a line break.
[[nodiscard]] std::string supplyLine(const Supply& supply, const Style& style);
/// In front of the bar.
inline constexpr std::size_t kSupplyLabel = 10;  // "  inodes  "

/// The numbers of a volume for programs.
[[nodiscard]] Dictionary jsonMembersOf(const VolumeSample& sample);

}  // namespace spacekeep::ctl
