// Thread safety: Page is confined to one thread; the functions are pure.
//
// One answer to a request for entries of the history.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>

#include "support/history/history_store.h"
#include "support/values/value.h"

namespace spacekeep::history {

inline constexpr std::size_t kDefaultPageEntries = 100;
inline constexpr std::size_t kMaxPageEntries = 1000;
/// An answer stays well below the largest message.
inline constexpr std::size_t kMaxPageBytes = 512 * 1024;

/// "SPACEKEEP_BEFORE" and "SPACEKEEP_VOLUME" of a request; what is of another kind counts as absent.
[[nodiscard]] HistoryRange rangeOf(const Dictionary& request);
/// "SPACEKEEP_LIMIT", 1 to kMaxPageEntries.
[[nodiscard]] std::size_t limitOf(const Dictionary& request);

/// No fewer than `value` takes in a message.
[[nodiscard]] std::size_t wireBytesAtMost(const Value& value);

/// Collects entries as the store shows them.
class Page {
 public:
  explicit Page(std::size_t max_entries, std::size_t max_bytes = kMaxPageBytes)
      : max_entries_(max_entries), max_bytes_(max_bytes) {}

  /// False when there was no room for it: the page is full and more is to come.
  [[nodiscard]] bool take(StoredEntry stored);
  [[nodiscard]] Dictionary answer() &&;

 private:
  const std::size_t max_entries_;
  const std::size_t max_bytes_;
  Array entries_;
  std::size_t used_bytes_ = 0;
  std::uint64_t last_number_ = 0;
  bool more_ = false;
};

}  // namespace spacekeep::history
