// Thread safety: none; confined to the daemon's defaults_queue.
//
// The record of recent statistics as an object, so that a thousand answers in a row need not turn
// it into bytes and back a thousand times.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "purgeable/recent_info.h"
#include "support/values/value.h"

namespace spacekeep {

struct KeptRecord {
  std::string key = {};  ///< of the client state
  std::shared_ptr<SpacekeepRecentInfo> record = nullptr;
  /// The bytes that stand in the state for it. None: the state has older ones, or none at all.
  std::optional<Data> archive = std::nullopt;

  [[nodiscard]] bool isNewerThanState() const { return record != nullptr && !archive; }
  /// Whether it is what `value` of the state is the archive of.
  [[nodiscard]] bool isArchivedAs(const Value& value) const {
    return record != nullptr && archive && value.data() != nullptr && *value.data() == *archive;
  }
};

}  // namespace spacekeep
