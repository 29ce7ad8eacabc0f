// Thread safety: every member may be called from any thread, but report() only from the host's
// supervising thread.
//
// What the parts of a host share: its state as the program sees it, the wish to stop, and one place
// to wait for any event.
#pragma once

#include <spacekeep/service.h>

#include <cstdint>
#include <functional>
#include <string>

#include "support/runtime/runtime.h"

namespace spacekeep::sdk {

class HostControl {
 public:
  explicit HostControl(std::function<void(const HostStatus&)> on_status);

  void stop();
  [[nodiscard]] bool stopping() const;

  /// Runs `change` under the control's lock and wakes whoever waits.
  void change(const std::function<void()>& change);
  /// Runs `look` under the control's lock.
  void look(const std::function<void()>& look) const;
  /// Until `condition`, which is looked at under the control's lock, holds, or the deadline has
  /// passed; answers whether it holds. With `until_stop` the wish to stop ends the wait as well.
  bool waitUntil(std::uint64_t deadline_ticks, const std::function<bool()>& condition,
                 bool until_stop = true);

  /// Sets the state and tells the program.
  void report(HostState state, std::string text = {});
  [[nodiscard]] HostStatus status() const;

  /// After the last report.
  void markEnded();
  void waitUntilEnded();

 private:
  const std::function<void(const HostStatus&)> on_status_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar changed_;
  HostStatus status_;
  bool stopping_ = false;
  bool ended_ = false;
};

}  // namespace spacekeep::sdk
