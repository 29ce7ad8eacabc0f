// Thread safety: confined to one queue at a time.
//
// Where the daemon keeps what it has done: entries in the order in which they came, each under a
// number of its own. The store is bounded; the oldest entries go first.
#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep {

/// Which entries are wanted.
struct HistoryRange {
  std::optional<std::uint64_t> before = std::nullopt;  ///< only numbers below; absent: all
  std::optional<std::string> volume = std::nullopt;    ///< only of this volume; absent: of all
};

struct StoredEntry {
  std::uint64_t number = 0;  ///< rises from 1, over restarts too
  Dictionary entry;
};

class HistoryStore {
 public:
  /// False: enough, no further entry is wanted.
  using Visitor = std::function<bool(StoredEntry entry)>;

  virtual ~HistoryStore() = default;

  /// All of them or, with a reason in words, none. They are on the disk when this returns.
  [[nodiscard]] virtual std::optional<std::string> append(
      const std::vector<Dictionary>& entries) = 0;
  /// Shows entries, newest first. Answers a reason in words when they cannot be read.
  [[nodiscard]] virtual std::optional<std::string> visit(const HistoryRange& range,
                                                         const Visitor& visitor) = 0;
};

}  // namespace spacekeep
