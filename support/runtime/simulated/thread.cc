#include <memory>
#include <utility>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/scheduler.h"

namespace spacekeep::rt {
namespace {

using simulated::Fiber;
using simulated::FiberState;
using simulated::Point;
using simulated::Scheduler;
using simulated::WaitKind;

using Handle = std::shared_ptr<Fiber>;

std::unique_ptr<Handle> take(void*& handle) {
  return std::unique_ptr<Handle>(static_cast<Handle*>(std::exchange(handle, nullptr)));
}

bool isUnwinding() {
  const Scheduler* const scheduler = Scheduler::current();
  return scheduler != nullptr && scheduler->unwinding();
}

}  // namespace

Thread::Thread(std::string name, std::function<void()> body) {
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) panic("a thread was started outside of a schedule");
  handle_ = new Handle(scheduler->start(std::move(name), std::move(body)));
  scheduler->reach(Point::kStart);
}

Thread::Thread(Thread&& other) noexcept : handle_(std::exchange(other.handle_, nullptr)) {}

Thread& Thread::operator=(Thread&& other) noexcept {
  if (joinable()) panic("a thread was assigned over before it was joined or detached");
  handle_ = std::exchange(other.handle_, nullptr);
  return *this;
}

Thread::~Thread() {
  if (!joinable()) return;
  if (!isUnwinding()) panic("a thread was destroyed before it was joined or detached");
  take(handle_);
}

void Thread::join() {
  if (!joinable()) panic("join of no thread");
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler == nullptr) panic("join outside of a schedule");
  scheduler->throwIfUnwinding();
  const std::unique_ptr<Handle> handle = take(handle_);
  Fiber& target = **handle;
  if (&target == &scheduler->running()) panic("a thread joins itself");
  scheduler->reach(Point::kWait);
  while (target.state != FiberState::kFinished) {
    scheduler->block(WaitKind::kJoin, &target.joiners, kNever, target.id);
    scheduler->throwIfUnwinding();
  }
}

void Thread::detach() {
  if (!joinable()) panic("detach of no thread");
  take(handle_);
}

}  // namespace spacekeep::rt
