// Thread safety: constants.
//
// The rights that clients and services need.
#pragma once

#include <string_view>

namespace spacekeep::entitlements {

inline constexpr std::string_view kClient = "CLIENT_ENTITLEMENT";  ///< to connect at all
inline constexpr std::string_view kPurgeable = "PURGEABLE_ENTITLEMENT";
inline constexpr std::string_view kItemizedPurgeable = "ITEMIZED_PURGEABLE_ENTITLEMENT";
inline constexpr std::string_view kPurge = "PURGE_ENTITLEMENT";
inline constexpr std::string_view kService = "SERVICE_ENTITLEMENT";

}  // namespace spacekeep::entitlements
