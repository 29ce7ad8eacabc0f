// Thread safety: pure functions.
//
// What the history tells of one purge or daily pass: small whatever the outcome holds, and free of
// whatever a client wrote into its request besides.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>

#include "support/values/value.h"

namespace spacekeep::history {

// "SPACEKEEP_KIND".
inline constexpr const char* kPurge = "purge";         ///< asked for by a client
inline constexpr const char* kLowSpace = "low space";  ///< by the daemon, on a volume that is short
inline constexpr const char* kDailyPass = "daily pass";  ///< by the daemon

// "SPACEKEEP_WHY_SHORT"; besides "refused: " with a text.
inline constexpr const char* kNoServices = "no services";
inline constexpr const char* kNoAnswerInTime = "no answer in time";
inline constexpr const char* kNothingMoreToGive = "nothing more to give";
inline constexpr const char* kCancelled = "cancelled";

/// Most services that an entry names, those that gave and those that did not answer.
inline constexpr std::size_t kMaxNamedServices = 32;
/// A service with a longer ID is not named.
inline constexpr std::size_t kMaxNamedIdBytes = 256;

/// Who asked, as the kernel vouched for it.
struct Asker {
  std::uint32_t uid = 0;
  std::int32_t pid = 0;
  std::optional<std::string> program = std::nullopt;
  std::optional<std::string> unit = std::nullopt;
};

struct PurgeFacts {
  std::optional<Asker> client;  ///< none: the daemon, for want of space
  Date ended;
  const Dictionary& request;
  const Dictionary& outcome;
  std::int32_t urgency_limit;
  std::size_t services;  ///< how many could have been asked
  const std::map<std::string, std::uint64_t>& reported_by_service;  ///< bytes, of all urgencies
};
[[nodiscard]] Dictionary purgeEntry(const PurgeFacts& facts);

struct DailyPassFacts {
  Date ended;
  const Dictionary& request;
  const Dictionary& outcome;
  std::size_t services;  ///< how many were asked
  const std::set<std::string>& in_flight;
  std::uint64_t freespace_begin_bytes;
  std::uint64_t freespace_end_bytes;
  double elapsed_seconds;
};
[[nodiscard]] Dictionary dailyPassEntry(const DailyPassFacts& facts);

}  // namespace spacekeep::history
