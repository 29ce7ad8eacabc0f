// Thread safety: may be made and destroyed on any thread. The task runs on the IPC thread.
//
// A one-shot timer on the IPC thread, so that a call with a deadline needs no thread of its own.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "support/ipc/linux/ipc_loop.h"

namespace spacekeep::sdk {

class DeadlineTimer {
 public:
  /// `fire` runs once after `duration_ns`, and must be short. The loop must outlive the timer.
  DeadlineTimer(ipc::IpcLoop& loop, std::uint64_t duration_ns, std::function<void()> fire);
  /// Takes the timer back; a task that runs already is not waited for.
  ~DeadlineTimer();
  DeadlineTimer(const DeadlineTimer&) = delete;
  DeadlineTimer& operator=(const DeadlineTimer&) = delete;

 private:
  struct Slot;
  ipc::IpcLoop& loop_;
  std::shared_ptr<Slot> slot_;
};

}  // namespace spacekeep::sdk
