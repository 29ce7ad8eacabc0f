// Thread safety: each object belongs to the thread of its test.
//
// Keeps the IPC thread from its sockets until it is let go.
#pragma once

#include <functional>
#include <memory>

#include "support/ipc/linux/ipc_loop.h"
#include "support/queues/waiting.h"

namespace spacekeep::ipc::test {

class BusyLoop {
 public:
  /// Returns once the thread is busy.
  explicit BusyLoop(IpcLoop& loop) : BusyLoop(loop, nullptr) {}
  /// Lets `before` go, so that the thread does no more in between than what comes before this task.
  /// What `post_behind` posts runs right after this task, before the sockets are looked at.
  BusyLoop(IpcLoop& loop, BusyLoop* before, const std::function<void()>& post_behind = nullptr) {
    loop.post([state = state_] {
      state->begun.signal();
      state->released.wait();
    });
    if (post_behind) post_behind();
    if (before != nullptr) before->letGo();
    state_->begun.wait();
  }
  ~BusyLoop() { letGo(); }
  BusyLoop(const BusyLoop&) = delete;
  BusyLoop& operator=(const BusyLoop&) = delete;
  void letGo() { state_->released.signal(); }

 private:
  struct State {
    CountingSemaphore begun{0};
    CountingSemaphore released{0};
  };
  std::shared_ptr<State> state_ = std::make_shared<State>();
};

}  // namespace spacekeep::ipc::test
