#include <new>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/scheduler.h"

namespace spacekeep::rt {
namespace {

using simulated::Fiber;
using simulated::kNoFiber;
using simulated::Point;
using simulated::Scheduler;
using simulated::WaitKind;
using simulated::WaitList;

struct MutexState {
  bool locked = false;
  std::uint32_t holder = kNoFiber;  ///< none while unlocked, and when locked outside a schedule
  WaitList waiters;
};

struct CondVarState {
  WaitList waiters;
};

template <typename T>
T& stateIn(std::byte* storage) {
  static_assert(sizeof(T) <= 64 && alignof(T) <= alignof(std::max_align_t));
  return *std::launder(reinterpret_cast<T*>(storage));
}

// Whoever still waits on an object that goes away is part of a broken program, or of a schedule
// that is being unwound, where only the list must not be used any more.
void forgetWaiters(WaitList& waiters, const char* complaint) {
  if (waiters.empty()) return;
  const Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr || !scheduler->unwinding()) panic(complaint);
  for (Fiber* const fiber : waiters) fiber->wait_list = nullptr;
}

void lockOutside(MutexState& mutex) {
  if (mutex.locked) panic("a lock that is taken outside of a schedule can never become free");
  mutex.locked = true;
}

// Without the scheduling point, and without an exception: for the way back from a wait.
void acquire(Scheduler& scheduler, MutexState& mutex) {
  while (mutex.locked) scheduler.block(WaitKind::kLock, &mutex.waiters, kNever, mutex.holder);
  mutex.locked = true;
  mutex.holder = scheduler.running().id;
}

void acquireOrUnwind(Scheduler& scheduler, MutexState& mutex) {
  while (mutex.locked) {
    if (mutex.holder == scheduler.running().id) panic("a lock was taken twice by the same thread");
    scheduler.block(WaitKind::kLock, &mutex.waiters, kNever, mutex.holder);
    scheduler.throwIfUnwinding();
  }
  acquire(scheduler, mutex);
}

void release(Scheduler& scheduler, MutexState& mutex) {
  if (!mutex.locked || mutex.holder != scheduler.running().id) {
    panic("a lock was given back by a thread that does not hold it");
  }
  mutex.locked = false;
  mutex.holder = kNoFiber;
  scheduler.wakeAny(mutex.waiters);
}

}  // namespace

Mutex::Mutex() { new (storage_) MutexState; }

Mutex::~Mutex() {
  auto& state = stateIn<MutexState>(storage_);
  forgetWaiters(state.waiters, "a lock was destroyed while somebody waits for it");
  state.~MutexState();
}

void Mutex::lock() {
  auto& state = stateIn<MutexState>(storage_);
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) return lockOutside(state);
  scheduler->throwAtLockIfUnwinding();
  scheduler->reach(Point::kLock);
  acquireOrUnwind(*scheduler, state);
}

void Mutex::unlock() {
  auto& state = stateIn<MutexState>(storage_);
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) {
    state.locked = false;
    return;
  }
  release(*scheduler, state);
  scheduler->reach(Point::kUnlock);
}

CondVar::CondVar() { new (storage_) CondVarState; }

CondVar::~CondVar() {
  auto& state = stateIn<CondVarState>(storage_);
  forgetWaiters(state.waiters, "a condition was destroyed while somebody waits for it");
  state.~CondVarState();
}

void CondVar::wait(Mutex& mutex) { static_cast<void>(waitUntil(mutex, kNever)); }

bool CondVar::waitUntil(Mutex& mutex, std::uint64_t deadline_ticks) {
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) {
    if (deadline_ticks == kNever) panic("a wait outside of a schedule can never end");
    if (deadline_ticks > ticks()) sleepNs(deadline_ticks - ticks());
    return false;
  }
  scheduler->throwIfUnwinding();
  auto& lock = stateIn<MutexState>(mutex.storage_);
  bool in_time = deadline_ticks > scheduler->now();
  release(*scheduler, lock);
  if (!in_time || scheduler->wakesSpuriously()) {
    scheduler->reach(Point::kWait);
  } else {
    auto& state = stateIn<CondVarState>(storage_);
    in_time = scheduler->block(WaitKind::kNotification, &state.waiters, deadline_ticks);
  }
  acquire(*scheduler, lock);
  scheduler->throwIfUnwinding();
  return in_time;
}

void CondVar::notifyOne() {
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) return;
  scheduler->wakeAny(stateIn<CondVarState>(storage_).waiters);
  scheduler->reach(Point::kNotify);
}

void CondVar::notifyAll() {
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) return;
  scheduler->wakeAll(stateIn<CondVarState>(storage_).waiters);
  scheduler->reach(Point::kNotify);
}

}  // namespace spacekeep::rt
