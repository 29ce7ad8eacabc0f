// Thread safety: constants.
//
// The names by which the daemon finds what belongs to it, for whoever looks at the same things.
#pragma once

namespace spacekeep {

/// Directories of service descriptors, in the order in which they are scanned. Paths from the root.
inline constexpr const char* kSystemDescriptors = "/System/Library/Spacekeep/";
inline constexpr const char* kInternalDescriptors = "/QuorvelInternal/Library/Spacekeep/";

/// The preferences suite that holds the client state.
inline constexpr const char* kSuiteName = "com.quorvel.spacekeep";
/// The scheduled activity of the daily pass.
inline constexpr const char* kDailyActivity = "com.quorvel.Spacekeep.daily";

}  // namespace spacekeep
