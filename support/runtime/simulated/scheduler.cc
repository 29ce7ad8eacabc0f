#include "support/runtime/simulated/scheduler.h"

#include <algorithm>

namespace spacekeep::rt::simulated {

Scheduler* Scheduler::current_ = nullptr;

Scheduler::Scheduler(const ScheduleOptions& options)
    : options_(options),
      picker_(options),
      program_random_(SplitMix::mix(options.seed + 1)),
      world_random_(SplitMix::mix(options.seed + 2)),
      trace_hash_(SplitMix::mix(options.seed)) {
  if (current_ != nullptr) panic("runSchedule inside a schedule");
  current_ = this;
}

Scheduler::~Scheduler() { current_ = nullptr; }

std::shared_ptr<Fiber> Scheduler::start(std::string name, std::function<void()> body) {
  const std::uint32_t id = next_id_++;
  auto fiber = std::make_shared<Fiber>(id, std::move(name), std::move(body), stacks_.take(),
                                       &Scheduler::fiberMain);
  picker_.prepare(*fiber);
  alive_.emplace(id, fiber);
  makeRunnable(*fiber);
  return fiber;
}

void Scheduler::fiberMain() {
  Context::arrive();
  Scheduler& self = *current_;
  self.freeFinished();
  self.runBodyOf(*self.running_);
  self.finishRunning();
}

void Scheduler::runBodyOf(Fiber& fiber) {
  try {
    fiber.body();
  } catch (const Abandoned&) {
  } catch (const std::exception& error) {
    if (fiber.id != 0) panic(("ended by an exception: " + std::string(error.what())).c_str());
    body_exception_ = std::current_exception();
  } catch (...) {
    if (fiber.id != 0) panic("ended by an exception that is no std::exception");
    body_exception_ = std::current_exception();
  }
  fiber.body = nullptr;  // Here, since what it captured may lock when it goes.
}

void Scheduler::finishRunning() {
  Fiber& fiber = *running_;
  if (fiber.id == 0 && !unwinding_) {
    body_returned_ = true;
    body_end_ticks_ = now_ticks_;
  }
  removeFromRunnable(fiber);
  fiber.state = FiberState::kFinished;
  wakeAll(fiber.joiners);
  finished_ = std::move(alive_.at(fiber.id));
  alive_.erase(fiber.id);
  switchAway(true);
  panic("a finished fiber was run again");
}

/// Runs somebody else, or the schedule's own loop when nobody can run.
void Scheduler::switchAway(bool for_good) {
  Fiber* const self = running_;
  Fiber* const next = pickNext(for_good ? Point::kEnd : Point::kWait);
  running_ = next;
  if (next == self) return;
  Context& to = next == nullptr ? root_ : next->context;
  if (for_good) self->context.leaveTo(to);
  self->context.switchTo(to);
  freeFinished();
}

void Scheduler::reach(Point point) {
  if (unwinding_) {
    if (++unwinding_steps_ > kMaxUnwindingSteps) giveUpRunning();
    return;
  }
  Fiber* const self = running_;
  Fiber* const next = pickNext(point);
  if (next == self) return;
  running_ = next;
  self->context.switchTo(next == nullptr ? root_ : next->context);
  freeFinished();
}

bool Scheduler::block(WaitKind kind, WaitList* list, std::uint64_t deadline_ticks,
                      std::uint32_t waits_on) {
  Fiber& self = *running_;
  removeFromRunnable(self);
  self.state = FiberState::kBlocked;
  self.waits_for = kind;
  self.waits_on = waits_on;
  self.deadline_passed = false;
  self.deadline_ticks = deadline_ticks;
  self.wait_list = list;
  if (list != nullptr) list->push_back(&self);
  if (deadline_ticks != kNever) timers_.emplace(TimerKey{deadline_ticks, self.id}, &self);
  switchAway(false);
  return !self.deadline_passed;
}

void Scheduler::wake(Fiber& fiber) {
  leaveWaits(fiber);
  makeRunnable(fiber);
}

void Scheduler::wakeAny(WaitList& list) {
  if (!list.empty()) wake(*list[list.size() == 1 ? 0 : picker_.below(list.size())]);
}

void Scheduler::wakeAll(WaitList& list) {
  while (!list.empty()) wake(*list.back());
}

void Scheduler::leaveWaits(Fiber& fiber) {
  if (fiber.wait_list != nullptr) {
    WaitList& list = *fiber.wait_list;
    list.erase(std::find(list.begin(), list.end(), &fiber));
    fiber.wait_list = nullptr;
  }
  if (fiber.deadline_ticks != kNever) timers_.erase({fiber.deadline_ticks, fiber.id});
  fiber.deadline_ticks = kNever;
  fiber.waits_on = kNoFiber;
}

void Scheduler::makeRunnable(Fiber& fiber) {
  fiber.state = FiberState::kRunnable;
  fiber.runnable_index = runnable_.size();
  runnable_.push_back(&fiber);
}

void Scheduler::removeFromRunnable(Fiber& fiber) {
  Fiber* const last = runnable_.back();
  runnable_[fiber.runnable_index] = last;
  last->runnable_index = fiber.runnable_index;
  runnable_.pop_back();
}

/// Null when the schedule's own loop has to take over.
Fiber* Scheduler::pickNext(Point point) {
  if (unwinding_) return nullptr;
  while (runnable_.empty()) {
    if (!advanceTime()) return nullptr;
  }
  if (steps_ >= options_.max_steps) {
    out_of_steps_ = true;
    return nullptr;
  }
  ++steps_;
  Fiber& next = picker_.pick(runnable_, running_, steps_);
  trace(next, point);
  return &next;
}

/// Goes to the earliest deadline and wakes all that waited for that instant.
bool Scheduler::advanceTime() {
  if (timers_.empty()) return false;
  now_ticks_ = std::max(now_ticks_, timers_.begin()->first.first);
  while (!timers_.empty() && timers_.begin()->first.first <= now_ticks_) {
    Fiber& fiber = *timers_.begin()->second;
    fiber.deadline_passed = true;
    wake(fiber);
  }
  return true;
}

void Scheduler::trace(const Fiber& next, Point point) {
  const std::uint64_t what = (std::uint64_t{next.id} << 8) | static_cast<std::uint64_t>(point);
  trace_hash_ = SplitMix::mix(trace_hash_ ^ what) + now_ticks_;
}

void Scheduler::freeFinished() {
  if (finished_ == nullptr) return;
  stacks_.giveBack(finished_->context.stack());
  finished_.reset();
}

std::int64_t Scheduler::wallClockNs() const {
  return options_.wall_clock_start_ns + static_cast<std::int64_t>(now_ticks_) + wall_jump_ns_;
}

}  // namespace spacekeep::rt::simulated
