// Thread safety: belongs to the one thread that runs the schedule.
//
// The heart of the deterministic runtime: fibers, virtual time, and the switch between them. The
// primitives (mutex.cc, thread.cc, clock.cc) are written on top of it.
#pragma once

#include <cstdint>
#include <exception>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/fiber.h"
#include "support/runtime/simulated/picker.h"
#include "support/runtime/simulated/stack_pool.h"
#include "support/runtime/simulation.h"
#include "support/runtime/splitmix.h"

namespace spacekeep::rt::simulated {

/// Thrown through a left-over fiber to unwind it. No std::exception on purpose: code that handles
/// errors of its tasks lets it pass.
struct Abandoned {};

/// The operations at which the schedule may go another way.
enum class Point : std::uint8_t { kLock, kUnlock, kNotify, kStart, kWait, kEnd };

class Scheduler {
 public:
  /// The one that runs on this process's schedule thread, null outside of runSchedule.
  [[nodiscard]] static Scheduler* current() { return current_; }

  explicit Scheduler(const ScheduleOptions& options);
  ~Scheduler();
  Scheduler(const Scheduler&) = delete;
  Scheduler& operator=(const Scheduler&) = delete;

  ScheduleReport run(const std::function<void()>& body);

  // For the primitives, called on a fiber.
  [[nodiscard]] Fiber& running() { return *running_; }
  std::shared_ptr<Fiber> start(std::string name, std::function<void()> body);
  /// Lets the schedule go another way.
  void reach(Point point);
  /// Waits until wake() or the deadline; false when it was the deadline. `list` may be null.
  bool block(WaitKind kind, WaitList* list, std::uint64_t deadline_ticks,
             std::uint32_t waits_on = kNoFiber);
  void wake(Fiber& fiber);
  /// Wakes one of the list, any of them.
  void wakeAny(WaitList& list);
  void wakeAll(WaitList& list);
  /// True with a small chance: a wait ends early now and then, as it may on real threads.
  [[nodiscard]] bool wakesSpuriously() { return picker_.below(kSpuriousOneIn) == 0; }

  // Unwinding (unwinding.cc).
  /// True on a fiber that runs only to be unwound.
  [[nodiscard]] bool unwinding() const { return unwinding_ && running_ != nullptr; }
  /// Called where an exception may leave: throws Abandoned while left-over fibers are unwound,
  /// except in a destructor that already runs because of an exception.
  void throwIfUnwinding() const;
  /// The same for locks that are free, after a few that are let through: destructors take locks,
  /// and one that was under way when the schedule ended must not be left by an exception.
  void throwAtLockIfUnwinding() const;
  /// Gives the running fiber up as it stands. Its stack is never touched again.
  [[noreturn]] void giveUpRunning();

  // What outlives its fibers (unwinding.cc).
  void remember(Keeper& keeper) { keepers_.push_back(&keeper); }
  void forget(const Keeper& keeper) { std::erase(keepers_, &keeper); }
  /// Null when there is none.
  [[nodiscard]] Keeper* takeKeeper();

  // Time and numbers.
  [[nodiscard]] std::uint64_t now() const { return now_ticks_; }
  [[nodiscard]] std::int64_t wallClockNs() const;
  void jumpWallClockNs(std::int64_t by_ns) { wall_jump_ns_ += by_ns; }
  [[nodiscard]] std::uint64_t randomNumber() { return program_random_.next(); }
  [[nodiscard]] std::uint64_t choose(std::uint64_t bound) { return world_random_.below(bound); }
  /// How to run the same schedule again, for messages.
  [[nodiscard]] std::string describe() const;

 private:
  static constexpr std::uint64_t kSpuriousOneIn = 16;
  /// Not `max_steps`: a schedule that is cut off after a few steps still has all to clear away.
  static constexpr std::uint64_t kMaxUnwindingSteps = 5'000'000;
  using TimerKey = std::pair<std::uint64_t, std::uint32_t>;  // deadline, fiber id

  static void fiberMain();
  void runBodyOf(Fiber& fiber);
  [[noreturn]] void finishRunning();
  void switchAway(bool for_good);
  Fiber* pickNext(Point point);
  bool advanceTime();
  void makeRunnable(Fiber& fiber);
  void removeFromRunnable(Fiber& fiber);
  void leaveWaits(Fiber& fiber);
  void freeFinished();
  void trace(const Fiber& next, Point point);

  void runUntilIdle();
  [[nodiscard]] ScheduleEnd howItEnded() const;
  [[nodiscard]] std::vector<std::string> describeBlocked() const;
  [[nodiscard]] std::string describeState(const Fiber& fiber) const;
  [[nodiscard]] std::string describeWait(const Fiber& fiber) const;

  // unwinding.cc
  void unwindLeftOvers();
  Fiber* nextToUnwind();
  Fiber* youngestBlocked(bool told);
  void giveUp(Fiber& fiber);

  static Scheduler* current_;

  const ScheduleOptions options_;
  Picker picker_;
  SplitMix program_random_;
  SplitMix world_random_;
  StackPool stacks_;

  Context root_;
  std::map<std::uint32_t, std::shared_ptr<Fiber>> alive_;  ///< by id, all that have not finished
  std::vector<Fiber*> runnable_;
  std::map<TimerKey, Fiber*> timers_;
  Fiber* running_ = nullptr;
  std::shared_ptr<Fiber> finished_;  ///< its stack is freed by whoever runs next
  std::uint32_t next_id_ = 0;

  std::uint64_t now_ticks_ = 0;
  std::int64_t wall_jump_ns_ = 0;
  std::uint64_t steps_ = 0;
  std::uint64_t trace_hash_;
  bool out_of_steps_ = false;
  bool body_returned_ = false;
  std::uint64_t body_end_ticks_ = 0;
  std::exception_ptr body_exception_;

  bool unwinding_ = false;
  std::uint64_t unwinding_steps_ = 0;
  std::vector<std::string> given_up_;
  std::vector<Keeper*> keepers_;
};

/// `name#id`, the way reports and messages call a fiber.
[[nodiscard]] std::string describeFiber(const Fiber& fiber);

}  // namespace spacekeep::rt::simulated
