// Thread safety: constants.
//
// The keys of the entries of the history, of requests for them and of the answer. Entries use those
// of operations/info_keys.h besides.
#pragma once

namespace spacekeep::keys {

inline constexpr const char* kEntry = "SPACEKEEP_ENTRY";    ///< number, rising from 1
inline constexpr const char* kDate = "SPACEKEEP_DATE";      ///< when it ended
inline constexpr const char* kKind = "SPACEKEEP_KIND";      ///< string, see history/entry.h
inline constexpr const char* kClient = "SPACEKEEP_CLIENT";  ///< dictionary, absent: the daemon
inline constexpr const char* kUid = "SPACEKEEP_UID";
inline constexpr const char* kPid = "SPACEKEEP_PID";
inline constexpr const char* kProgram = "SPACEKEEP_PROGRAM";  ///< string, as it calls itself
inline constexpr const char* kUnit = "SPACEKEEP_UNIT";        ///< string
inline constexpr const char* kAmountFreed = "SPACEKEEP_AMOUNT_FREED";  ///< bytes the volume gained
inline constexpr const char* kOtherServices =
    "SPACEKEEP_OTHER_SERVICES";  ///< bytes of those that are not named
inline constexpr const char* kWhyShort = "SPACEKEEP_WHY_SHORT";  ///< string, absent: it was not

inline constexpr const char* kBefore = "SPACEKEEP_BEFORE";    ///< number, only entries below it
inline constexpr const char* kLimit = "SPACEKEEP_LIMIT";      ///< number of entries
inline constexpr const char* kEntries = "SPACEKEEP_ENTRIES";  ///< array of entries, newest first
inline constexpr const char* kNext = "SPACEKEEP_NEXT";  ///< number that asks for the older ones

}  // namespace spacekeep::keys
