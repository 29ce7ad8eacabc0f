// Thread safety: InMemoryHistory may be used from any thread; a store is confined to one queue at a
// time, as every store is.
//
// A history whose disk is a list. It can be made to refuse.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "support/history/history_store.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class InMemoryHistory {
 public:
  /// What Platform::openHistory answers with; it refers to this object.
  [[nodiscard]] std::unique_ptr<HistoryStore> open();

  /// Oldest first.
  [[nodiscard]] std::vector<StoredEntry> entries() const;
  /// How many writes there were, whatever came of them.
  [[nodiscard]] std::uint64_t writes() const;
  /// From now on opening fails, or works again.
  void refuseToOpen(bool refuse);
  /// From now on writing and reading fail with this text; empty: works again.
  void fail(std::string reason);
  /// From now on a write takes that long.
  void setWriteTimeNs(std::uint64_t duration_ns);

 private:
  class Store;

  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::vector<StoredEntry> entries_;
  std::uint64_t writes_ = 0;
  bool refuse_to_open_ = false;
  std::string failure_;
  std::uint64_t write_time_ns_ = 0;
};

}  // namespace spacekeep::sim
