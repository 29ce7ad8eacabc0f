// Thread safety: plain values.
//
// Why files were left where they are. A person who asks "why is my cache still full" finds the
// answer here.
#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace spacekeep::cachedir {

enum class Left : std::size_t {
  kOpen,         // some process holds it open or mapped
  kLocked,       // a lock or a lease of somebody else
  kLinked,       // has a hard link outside of what may be deleted
  kNothingBack,  // its blocks are shared or not allocated: deleting it would give nothing
  kUsedSince,    // used, replaced or linked after it was chosen
  kUnreadable,   // cannot be opened, so nobody can tell whether it is in use
  kUnproven,     // no lease is to be had on it, and /proc hides who may have it open
  kElsewhere,    // a directory of another mount or subvolume, or a file that is mounted here
  kTooDeep,      // below kMaxDepth directories, or its path is too long
  kFailed,       // the file system refused
  kCount,
};

inline constexpr std::array<std::string_view, static_cast<std::size_t>(Left::kCount)> kLeftWords = {
    "open",
    "locked",
    "linked elsewhere",
    "nothing to give back",
    "used since chosen",
    "unreadable",
    "not known to be unused",
    "another file system",
    "too deep",
    "refused by the file system"};

struct Tally {
  std::array<std::uint64_t, static_cast<std::size_t>(Left::kCount)> counts{};

  void add(Left why) { ++counts[static_cast<std::size_t>(why)]; }
  [[nodiscard]] bool empty() const {
    return std::ranges::all_of(counts, [](std::uint64_t count) { return count == 0; });
  }
  [[nodiscard]] std::uint64_t of(Left why) const { return counts[static_cast<std::size_t>(why)]; }
};

}  // namespace spacekeep::cachedir
