// Thread safety: constants.
//
// The rights that a peer can hold.
#pragma once

#include <array>
#include <string_view>

namespace spacekeep::access {

inline constexpr std::string_view kClientEntitlement = "CLIENT_ENTITLEMENT";
inline constexpr std::string_view kPurgeableEntitlement = "PURGEABLE_ENTITLEMENT";
inline constexpr std::string_view kItemizedPurgeableEntitlement = "ITEMIZED_PURGEABLE_ENTITLEMENT";
inline constexpr std::string_view kPurgeEntitlement = "PURGE_ENTITLEMENT";
inline constexpr std::string_view kServiceEntitlement = "SERVICE_ENTITLEMENT";

inline constexpr std::array kAllEntitlements = {kClientEntitlement, kPurgeableEntitlement,
                                                kItemizedPurgeableEntitlement, kPurgeEntitlement,
                                                kServiceEntitlement};

}  // namespace spacekeep::access
