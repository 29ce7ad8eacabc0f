#include "purge/decisions.h"

#include <algorithm>

namespace spacekeep::purge {

std::uint64_t donation(std::uint64_t needed_bytes, std::uint64_t purged_bytes,
                       std::uint64_t viable_services) {
  return (needed_bytes - purged_bytes) / std::max<std::uint64_t>(viable_services, 1);
}

std::uint64_t waitSeconds(std::uint64_t user_timeout_seconds, std::int32_t urgency) {
  if (user_timeout_seconds != 0) return user_timeout_seconds;
  return 2 * static_cast<std::uint64_t>(urgency);
}

std::int32_t percentBucket(std::uint64_t requested_bytes, std::uint64_t purged_bytes) {
  const auto requested = static_cast<float>(static_cast<std::int64_t>(requested_bytes));
  const auto purged = static_cast<float>(static_cast<std::int64_t>(purged_bytes));
  const double tenths = static_cast<double>(purged / requested) * 10.0;
  constexpr double kLargest = INT32_MAX / 10;
  constexpr double kSmallest = INT32_MIN / 10;
  return static_cast<std::int32_t>(std::clamp(tenths, kSmallest, kLargest)) * 10;
}

std::string urgencyInfoKey(std::int32_t urgency) {
  return "SPACEKEEP_URGENCY_" + std::to_string(urgency) + "_OPERATION_INFO";
}

std::string urgencyTimeoutKey(std::int32_t urgency) {
  return "SPACEKEEP_URGENCY_" + std::to_string(urgency) + "_TIMEOUT_SECONDS";
}

std::string urgencyStatsKey(std::int32_t urgency) {
  return "SPACEKEEP_OPERATION_STATS_URGENCY_" + std::to_string(urgency);
}

std::string urgencyStatsText(std::uint64_t reported_bytes, std::uint64_t purged_bytes,
                             std::uint64_t needed_bytes, bool cancelled) {
  return "amount reported: " + std::to_string(reported_bytes) +
         ", amountPurged: " + std::to_string(purged_bytes) +
         ", purge_amount_needed: " + std::to_string(needed_bytes) +
         ", cancel: " + (cancelled ? "TRUE" : "FALSE");
}

}  // namespace spacekeep::purge
