// How one schedule goes from start to report.
#include <array>
#include <utility>

#include "support/runtime/simulated/scheduler.h"

namespace spacekeep::rt::simulated {

std::string describeFiber(const Fiber& fiber) {
  return fiber.name + "#" + std::to_string(fiber.id);
}

std::string Scheduler::describeWait(const Fiber& fiber) const {
  const auto found = alive_.find(fiber.waits_on);
  const std::string whom =
      found == alive_.end() ? "a thread that has ended" : describeFiber(*found->second);
  switch (fiber.waits_for) {
    case WaitKind::kLock:
      return "waits for a lock held by " + whom;
    case WaitKind::kNotification:
      return "waits for a notification";
    case WaitKind::kJoin:
      return "waits for the end of " + whom;
    case WaitKind::kSleep:
      return "sleeps";
  }
  panic("unknown wait");
}

std::string Scheduler::describeState(const Fiber& fiber) const {
  if (fiber.state != FiberState::kBlocked) return "can run";
  std::string text = describeWait(fiber);
  if (fiber.deadline_ticks != kNever) {
    text += " until " + std::to_string(fiber.deadline_ticks) + " ns";
  }
  return text;
}

std::string Scheduler::describe() const {
  std::string text = "seed " + std::to_string(options_.seed);
  text += options_.strategy == Strategy::kRandom
              ? ", random"
              : ", pct depth " + std::to_string(options_.pct_depth);
  text += ", step " + std::to_string(steps_) + ", at " + std::to_string(now_ticks_) + " ns";
  if (running_ != nullptr) text += ", " + describeFiber(*running_);
  return text;
}

std::vector<std::string> Scheduler::describeBlocked() const {
  std::vector<std::string> lines;
  for (const auto& [id, fiber] : alive_) {
    lines.push_back(describeFiber(*fiber) + ": " + describeState(*fiber));
  }
  return lines;
}

ScheduleEnd Scheduler::howItEnded() const {
  if (out_of_steps_) return ScheduleEnd::kStuck;
  return body_returned_ ? ScheduleEnd::kFinished : ScheduleEnd::kDeadlock;
}

void Scheduler::runUntilIdle() {
  running_ = pickNext(Point::kStart);
  if (running_ == nullptr) return;
  root_.switchTo(running_->context);
  freeFinished();
}

ScheduleReport Scheduler::run(const std::function<void()>& body) {
  start("main", [&body] { body(); });
  runUntilIdle();
  ScheduleReport report;
  report.end = howItEnded();
  report.steps = steps_;
  report.trace_hash = trace_hash_;
  report.virtual_ns = body_returned_ ? body_end_ticks_ : now_ticks_;
  report.blocked = describeBlocked();
  unwindLeftOvers();
  report.blocked.insert(report.blocked.end(), given_up_.begin(), given_up_.end());
  if (body_exception_ != nullptr) std::rethrow_exception(std::exchange(body_exception_, nullptr));
  return report;
}

}  // namespace spacekeep::rt::simulated

namespace spacekeep::rt {

using simulated::Scheduler;

ScheduleReport runSchedule(const ScheduleOptions& options, const std::function<void()>& body) {
  Scheduler scheduler(options);
  return scheduler.run(body);
}

bool insideSchedule() { return Scheduler::current() != nullptr; }

bool clearingAway() { return insideSchedule() && Scheduler::current()->unwinding(); }

void jumpWallClockNs(std::int64_t by_ns) {
  if (!insideSchedule()) panic("jumpWallClockNs outside a schedule");
  Scheduler::current()->jumpWallClockNs(by_ns);
}

std::uint64_t choose(std::uint64_t bound) {
  if (!insideSchedule()) panic("choose outside a schedule");
  if (bound == 0) panic("choose from nothing");
  return Scheduler::current()->choose(bound);
}

}  // namespace spacekeep::rt
