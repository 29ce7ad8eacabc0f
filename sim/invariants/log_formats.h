// Thread safety: constants and pure functions.
//
// The log lines from which the invariants read what happened, by their exact formats.
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
inline constexpr std::string_view kDonated = "%s %@ donated %lld of %lld";
inline constexpr std::string_view kSignalling =
    "%s All services accounted for, signalling the semaphore.";
inline constexpr std::string_view kTook = "%s %@ took %f seconds, purged: %@";
inline constexpr std::string_view kFailed = "%s connection invalidated";

// The in-flight set.
inline constexpr std::string_view kInFlight = "%s %s %@";
inline constexpr std::string_view kAlreadyIn = "%s trying to add \"%@\", which is already inFlight";
inline constexpr std::string_view kNotIn = "%s trying to remove \"%@\", which is not inFlight";

// Queries.
inline constexpr std::string_view kQueryEntry = "%s ENTRY, info: %@";
inline constexpr std::string_view kQueryAsking = "%s ^^^asking %@ for urgency %d";
inline constexpr std::string_view kQueryTook = "%s %@ took %f seconds, returned: %@";
inline constexpr std::string_view kFailedNamed = "%s connection invalidated: %@";
inline constexpr std::string_view kWaitingALittle = "%s ^^^waiting for a little bit";
inline constexpr std::string_view kDoneWaiting = "%s ^^^done waiting, inFlight: %@";
inline constexpr std::string_view kBeatTheTimeout = "%s ^^^beat the timeout, woohoo!";
inline constexpr std::string_view kTick = "%s --------- %s --------- %llu ---------";
inline constexpr std::string_view kExtension = "%s maxExtensions: %d";
inline constexpr std::string_view kSecondPass = "%s cachedInfo (2nd pass): %@";
inline constexpr std::string_view kStillInFlight = "%s Still in flight: %@";
inline constexpr std::string_view kQueryResult = "%s elapsed time: %f result: %@";

// The record of recent answers.
inline constexpr std::string_view kToCount = "%s servicesToCount: %@";
inline constexpr std::string_view kToQuery = "%s servicesToQuery: %@";
inline constexpr std::string_view kAllCached = "%s using all cached info";
inline constexpr std::string_view kRecordInvalid = "%s Recent Info is invalid, deleting...";
inline constexpr std::string_view kRecordChanged = "%s Recent Info need syncing. New values: %@";
inline constexpr std::string_view kRecordUpdate = "%s ^^^ENTRY, serviceID: %@ : %@, recentInfo: %@";

// The periodic pass.
inline constexpr std::string_view kPeriodicCalling = "%s CallService with serviceID: %@";
inline constexpr std::string_view kPeriodicReplied = "%s proxy %@ replied, purged: %@";
inline constexpr std::string_view kPeriodicResult = "%s result: %@";

// The registry and its services.
inline constexpr std::string_view kExistingService = "%s operating on an existing service";
inline constexpr std::string_view kPinging = "%s calling servicePing";
inline constexpr std::string_view kPong = "%s ping got pong";
inline constexpr std::string_view kNotifying = "%s name: %@, value: %@";
inline constexpr std::string_view kNotEntitled = "%s Connection is not entitled!";

// Low space.
inline constexpr std::string_view kNoneLow = "%s No volumes report low disk space, skipping purge";

/// Empty, 0 or an empty dictionary when the field is missing or of another kind.
[[nodiscard]] std::string textField(const LogLine& line, std::size_t index);
[[nodiscard]] std::uint64_t numberField(const LogLine& line, std::size_t index);
[[nodiscard]] Dictionary dictionaryField(const LogLine& line, std::size_t index);

}  // namespace spacekeep::sim::formats
