// The end of a schedule: every fiber that is left is unwound, so that nothing leaks into the next.
//
// The youngest goes first, since it may use what an older one owns. Each is woken where it waits
// and throws there. Destructors on the way may lock and wait for real; they get what they wait for
// when other fibers unwind. What still waits after all that (a destructor that hangs, a wait inside
// a noexcept function) is given up: its stack stays as it is, reachable and never run again.
#include <algorithm>
#include <exception>
#include <utility>

#include "support/runtime/simulated/sanitizer.h"
#include "support/runtime/simulated/scheduler.h"

namespace spacekeep::rt::simulated {
namespace {

constexpr unsigned kMaxFruitlessWakes = 100;
constexpr unsigned kLocksLetThrough = 300;

std::terminate_handler previous_terminate = nullptr;

// An exception that meets a noexcept function lands here. While fibers are unwound that costs only
// the one fiber; at any other time it is the program's end as always.
void terminateFiberOrProcess() {
  Scheduler* const scheduler = Scheduler::current();
  if (scheduler != nullptr && scheduler->unwinding()) scheduler->giveUpRunning();
  previous_terminate();
  panic("the terminate handler returned");
}

class TerminateHandler {
 public:
  TerminateHandler() { previous_terminate = std::set_terminate(terminateFiberOrProcess); }
  ~TerminateHandler() { std::set_terminate(previous_terminate); }
  TerminateHandler(const TerminateHandler&) = delete;
  TerminateHandler& operator=(const TerminateHandler&) = delete;
};

// Kept for good: other objects may hold pointers into the stacks.
std::vector<std::shared_ptr<Fiber>>& givenUpFibers() {
  static auto* const fibers = new std::vector<std::shared_ptr<Fiber>>;
  return *fibers;
}

}  // namespace

void Scheduler::throwIfUnwinding() const {
  if (unwinding_ && std::uncaught_exceptions() == 0) throw Abandoned{};
}

void Scheduler::throwAtLockIfUnwinding() const {
  if (!unwinding_ || std::uncaught_exceptions() != 0) return;
  if (++running_->locks_while_unwinding > kLocksLetThrough) throw Abandoned{};
}

void Scheduler::unwindLeftOvers() {
  const TerminateHandler handler;
  unwinding_ = true;
  while (!alive_.empty()) {
    running_ = nextToUnwind();
    if (running_ == nullptr) continue;
    root_.switchTo(running_->context);
    freeFinished();
    running_ = nullptr;
  }
}

/// Null when a fiber was given up instead.
Fiber* Scheduler::nextToUnwind() {
  if (!runnable_.empty()) {
    return *std::max_element(runnable_.begin(), runnable_.end(),
                             [](const Fiber* a, const Fiber* b) { return a->id < b->id; });
  }
  if (Fiber* const fiber = youngestBlocked(false); fiber != nullptr) {
    fiber->told_to_unwind = true;
    wake(*fiber);
    return fiber;
  }
  if (advanceTime()) return runnable_.front();
  Fiber* const fiber = youngestBlocked(true);
  if (++fiber->fruitless_wakes > kMaxFruitlessWakes) {
    giveUp(*fiber);
    return nullptr;
  }
  wake(*fiber);
  return fiber;
}

Fiber* Scheduler::youngestBlocked(bool told) {
  for (auto entry = alive_.rbegin(); entry != alive_.rend(); ++entry) {
    Fiber& fiber = *entry->second;
    if (fiber.state == FiberState::kBlocked && fiber.told_to_unwind == told) return &fiber;
  }
  return nullptr;
}

void Scheduler::giveUp(Fiber& fiber) {
  if (fiber.state == FiberState::kRunnable) {
    removeFromRunnable(fiber);
  } else {
    leaveWaits(fiber);
  }
  given_up_.push_back(describeFiber(fiber) + ": could not be unwound");
  const Stack stack = fiber.context.stack();
  keepReachable(stack.bottom, stack.bytes);
  givenUpFibers().push_back(std::move(alive_.at(fiber.id)));
  alive_.erase(fiber.id);
}

Keeper* Scheduler::takeKeeper() {
  if (keepers_.empty()) return nullptr;
  Keeper* const last = keepers_.back();
  keepers_.pop_back();
  return last;
}

void Scheduler::giveUpRunning() {
  Fiber& fiber = *running_;
  giveUp(fiber);
  fiber.context.switchTo(root_);
  panic("a fiber that was given up was run again");
}

}  // namespace spacekeep::rt::simulated

namespace spacekeep::rt {

Keeper::Keeper() {
  if (insideSchedule()) simulated::Scheduler::current()->remember(*this);
}

Keeper::~Keeper() {
  if (insideSchedule()) simulated::Scheduler::current()->forget(*this);
}

void letKeepersGo() {
  while (Keeper* const keeper = simulated::Scheduler::current()->takeKeeper()) {
    keeper->letGo();
  }
}

}  // namespace spacekeep::rt
