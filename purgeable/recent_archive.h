// Thread safety: pure functions.
//
// The record of recent answers as bytes, and back: a binary property list that describes itself,
//
//   {"format": "SpacekeepRecentInfo", "version": 1,
//    "volumes": {PATH: {"freespace": BYTES, "timestamp": DATE, "volumeName": PATH,
//                       "services": {ID: {"amount": VALUE, "timestamp": DATE}}}}}
//
// so that a tool can read it out of the client state.
#pragma once

#include <optional>

#include "purgeable/recent_info.h"
#include "support/values/value.h"

namespace spacekeep {

/// Dates keep whole microseconds. Empty when the record is too large for a property list.
[[nodiscard]] Data archivedRecentInfo(const SpacekeepRecentInfo& record);

/// None when the bytes are anything else, of another version, or a part has the wrong kind.
[[nodiscard]] std::optional<SpacekeepRecentInfo> recentInfoFromArchive(const Data& archive);

}  // namespace spacekeep
