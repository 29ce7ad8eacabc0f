// Thread safety: every member may be called from any thread.
//
// Counts keep-alive transactions.
#pragma once

#include <cstddef>
#include <functional>

#include "support/events/events.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

class KeepAliveCount final : public KeepAlive {
 public:
  /// Told whenever the first transaction opens (true) or the last one ends (false), in that order,
  /// from within begin() and end(); it must return soon and not come back here.
  using Changed = std::function<void(bool busy)>;

  explicit KeepAliveCount(Changed changed);

  void begin() override;
  /// Without a begin() before it, a panic.
  void end() override;

  [[nodiscard]] std::size_t open() const;

 private:
  const Changed changed_;
  mutable rt::Mutex mutex_;  // held while changed_ runs, so that it is told in order
  std::size_t open_ = 0;     // protected by mutex_
};

}  // namespace spacekeep
