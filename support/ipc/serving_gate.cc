#include "support/ipc/serving_gate.h"

#include <mutex>

#include "support/queues/concurrent_queue.h"

namespace spacekeep::ipc {

bool ServingGate::enter() {
  const std::scoped_lock lock(mutex_);
  if (closed_) return false;
  ++inside_;
  return true;
}

void ServingGate::leave() {
  const std::scoped_lock lock(mutex_);
  if (--inside_ == 0 && closed_) empty_.notifyAll();
}

void ServingGate::closeAndWait() {
  const BlockingRegion waiting;
  const std::scoped_lock lock(mutex_);
  closed_ = true;
  while (inside_ > 0) empty_.wait(mutex_);
}

}  // namespace spacekeep::ipc
