// Thread safety: constants and pure functions.
//
// The log lines from which purges are read, by their exact formats.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "sim/world/trace.h"

namespace spacekeep::sim::formats {

// The course of a purge.
inline constexpr std::string_view kBegin = "%s urgencyLimit: %d, info at start: %@";
inline constexpr std::string_view kInQueue = "%s IN QUEUE, amountPurged: %llu";
inline constexpr std::string_view kUrgency = "%s Urgency: %d";
inline constexpr std::string_view kWaiting =
    "%s waiting for %llu seconds, user_timeout_seconds: %llu, currentUrgency: %d";
inline constexpr std::string_view kTimedOut = "%s timed out waiting for: %@";
inline constexpr std::string_view kStatistics = "%s %@ : %@";
inline constexpr std::string_view kCancelling = "%s cancelling purge";
inline constexpr std::string_view kResult = "%s result %@";

// One service's request.
inline constexpr std::string_view kQueuing = "%s queuing service: %@";
inline constexpr std::string_view kDonation =
    "%s donation (%lld) = (amount needed[%llu] - amount_purged[%llu]) / "
    "viable_purging_services[%llu])";
inline constexpr std::string_view kPurged = "%s %@ service purged: %llu";
inline constexpr std::string_view kCompletion = "%s %@ calling completion with: %@";
inline constexpr std::string_view kSignalling =
    "%s All services accounted for, signalling the semaphore.";
inline constexpr std::string_view kTook = "%s %@ took %f seconds, purged: %@";
inline constexpr std::string_view kFailed = "%s connection invalidated";

// The in-flight set.
inline constexpr std::string_view kInFlight = "%s %s %@";
inline constexpr std::string_view kAlreadyIn = "%s trying to add \"%@\", which is already inFlight";
inline constexpr std::string_view kNotIn = "%s trying to remove \"%@\", which is not inFlight";

/// Empty, 0 or an empty dictionary when the field is missing or of another kind.
[[nodiscard]] std::string textField(const LogLine& line, std::size_t index);
[[nodiscard]] std::uint64_t numberField(const LogLine& line, std::size_t index);
[[nodiscard]] Dictionary dictionaryField(const LogLine& line, std::size_t index);

}  // namespace spacekeep::sim::formats
