// Thread safety: every member may be called from any thread.
//
// Lets handlers in until it is closed, and waits for those that are inside. What a handler uses may
// be destroyed once closeAndWait() has returned.
#pragma once

#include <cstdint>

#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

class ServingGate {
 public:
  /// True while it is open; then leave() must follow.
  [[nodiscard]] bool enter();
  void leave();
  /// Not from inside.
  void closeAndWait();

 private:
  rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar empty_;
  std::uint64_t inside_ = 0;
  bool closed_ = false;
};

/// Inside for its scope, when the gate was open.
class GatePass {
 public:
  explicit GatePass(ServingGate& gate) : gate_(gate), inside_(gate.enter()) {}
  ~GatePass() {
    if (inside_) gate_.leave();
  }
  GatePass(const GatePass&) = delete;
  GatePass& operator=(const GatePass&) = delete;
  [[nodiscard]] bool inside() const { return inside_; }

 private:
  ServingGate& gate_;
  const bool inside_;
};

}  // namespace spacekeep::ipc
