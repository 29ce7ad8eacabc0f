// Thread safety: constants.
//
// The keys of requests, answers and service replies, and of what services say about themselves.
#pragma once

namespace spacekeep::keys {

// Requests and answers.
inline constexpr const char* kVolume = "SPACEKEEP_VOLUME";    ///< string, mount path
inline constexpr const char* kAmount = "SPACEKEEP_AMOUNT";    ///< number, bytes
inline constexpr const char* kUrgency = "SPACEKEEP_URGENCY";  ///< number, wins over the limit
inline constexpr const char* kUrgencyLimit = "SPACEKEEP_URGENCY_LIMIT";  ///< number
inline constexpr const char* kError = "SPACEKEEP_ERROR";                 ///< string, why refused
inline constexpr const char* kPurgeTimeout = "SPACEKEEP_PURGE_TIMEOUT";  ///< number, seconds
inline constexpr const char* kAsync = "SPACEKEEP_ASYNC";  ///< boolean, read by nobody
inline constexpr const char* kToken = "SPACEKEEP_TOKEN";  ///< names one purge request
inline constexpr const char* kFinishEarly =
    "SPACEKEEP_FINISH_EARLY";  ///< boolean, end when reached
inline constexpr const char* kExactUrgency =
    "SPACEKEEP_EXACT_URGENCY";  ///< boolean, count from memory only answers for the same urgency

// The outcome of a purge.
inline constexpr const char* kFreespaceBegin = "SPACEKEEP_FREESPACE_BEGIN";  ///< bytes
inline constexpr const char* kFreespaceEnd = "SPACEKEEP_FREESPACE_END";      ///< bytes
inline constexpr const char* kAmountReported = "SPACEKEEP_AMOUNT_REPORTED";  ///< bytes
/// Seconds in the outcome of a purge, nanoseconds in the answer of one service. Both are intended.
inline constexpr const char* kElapsedTime = "SPACEKEEP_ELAPSED_TIME";
inline constexpr const char* kOperationCancelled = "SPACEKEEP_OPERATION_CANCELLED";  ///< boolean
inline constexpr const char* kReportingServices = "SPACEKEEP_REPORTING_SERVICES";  ///< ID to bytes
inline constexpr const char* kServicesInFlight = "SPACEKEEP_SERVICES_INFLIGHT";    ///< array of IDs

// The answer of a query, and of a service to one.
inline constexpr const char* kTotalAvailable = "SPACEKEEP_TOTAL_AVAILABLE";  ///< bytes
inline constexpr const char* kOptOut = "SPACEKEEP_OPT_OUT";  ///< any value: do not ask again soon
inline constexpr const char* kServicesToQuery = "SPACEKEEP_SERVICES_TO_QUERY";  ///< array of IDs
inline constexpr const char* kServicesToCount = "SPACEKEEP_SERVICES_TO_COUNT";  ///< ID to bytes

// Client state.
/// The whole state in the suite; as a key of the state, all of it with the defaults.
inline constexpr const char* kUserDefaults = "SPACEKEEP_USER_DEFAULTS";
inline constexpr const char* kCacheEnabled = "SPACEKEEP_CACHE_ENABLED";               ///< boolean
inline constexpr const char* kRecentServiceStats = "SPACEKEEP_RECENT_SERVICE_STATS";  ///< bytes
/// Followed by the urgency: the same for queries with SPACEKEEP_EXACT_URGENCY.
inline constexpr const char* kRecentServiceStatsAtUrgency =
    "SPACEKEEP_RECENT_SERVICE_STATS_URGENCY_";

// Service descriptors and check-in.
inline constexpr const char* kServiceId = "SPACEKEEP_ID";
inline constexpr const char* kServiceRoles = "SPACEKEEP_SERVICES";
inline constexpr const char* kDoNotQuery = "SPACEKEEP_DO_NOT_QUERY";
inline constexpr const char* kNotifications = "SPACEKEEP_NOTIFICATIONS";
inline constexpr const char* kRolePurge = "PURGE";
inline constexpr const char* kRolePeriodic = "PERIODIC";
inline constexpr const char* kAnonymous = "ANON";

}  // namespace spacekeep::keys
