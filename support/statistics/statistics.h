// Thread safety: every member may be called from any thread.
//
// Statistics. One that cannot be recorded is dropped without a word.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace spacekeep {

/// The domain of every statistic of the daemon.
inline constexpr std::string_view kStatisticsDomain = "com.quorvel.spacekeep";

class Statistics {
 public:
  virtual ~Statistics() = default;
  /// Adds one observation to the distribution `key`.
  virtual void addDistributionStat(double value, std::string_view domain, std::string_view key) = 0;
  /// Adds `count` to the counter `key`; without a key nothing is recorded.
  virtual void addReportStat(std::string_view domain, std::optional<std::string_view> key,
                             std::int64_t count) = 0;
};

}  // namespace spacekeep
