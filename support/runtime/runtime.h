// Thread safety: every function and every object here may be used from any thread at any time.
//
// The one seam through which the whole daemon knows threads, blocking, time and randomness. Two
// implementations exist, and a program chooses one when it is linked: `runtime_threads` (real
// threads, real clocks) and `runtime_simulated` (one fiber runs at a time, picked by a seeded
// scheduler; time is virtual and moves only when everything waits). What is built on this header
// (queues, task groups, semaphores) is written once and runs unchanged on both.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>

namespace spacekeep::rt {

/// A deadline that never comes. Deadlines are in ticks of the monotonic counter.
inline constexpr std::uint64_t kNever = UINT64_MAX;

/// A non-recursive lock. Works with std::unique_lock and std::scoped_lock.
class Mutex {
 public:
  Mutex();
  ~Mutex();
  Mutex(const Mutex&) = delete;
  Mutex& operator=(const Mutex&) = delete;

  void lock();
  void unlock();

 private:
  friend class CondVar;
  alignas(std::max_align_t) std::byte storage_[64];
};

/// A condition variable for Mutex. Wake-ups may be spurious: wait in a loop over the condition.
class CondVar {
 public:
  CondVar();
  ~CondVar();
  CondVar(const CondVar&) = delete;
  CondVar& operator=(const CondVar&) = delete;

  /// The mutex must be held by the caller; it is released while waiting.
  void wait(Mutex& mutex);
  /// As wait, at most until `deadline_ticks`. Answers false when the deadline has passed.
  bool waitUntil(Mutex& mutex, std::uint64_t deadline_ticks);
  void notifyOne();
  void notifyAll();

 private:
  alignas(std::max_align_t) std::byte storage_[64];
};

/// A thread of control. Must be joined or detached before it is destroyed.
class Thread {
 public:
  Thread() = default;
  /// `name` is cut to 15 bytes where the kernel shows it. An exception that leaves `body` ends the
  /// process.
  Thread(std::string name, std::function<void()> body);
  Thread(Thread&& other) noexcept;
  Thread& operator=(Thread&& other) noexcept;
  ~Thread();

  [[nodiscard]] bool joinable() const { return handle_ != nullptr; }
  void join();
  void detach();

 private:
  void* handle_ = nullptr;
};

/// Nanoseconds per tick of the monotonic counter, as a fraction.
struct Timebase {
  std::uint32_t numerator;
  std::uint32_t denominator;
};

/// None when the counter cannot be read.
[[nodiscard]] std::optional<Timebase> timebase();

/// The monotonic counter (clock_gettime(2), CLOCK_MONOTONIC).
[[nodiscard]] std::uint64_t ticks();

/// The tick count that lies `duration_ns` nanoseconds ahead of now, kNever when out of range.
[[nodiscard]] std::uint64_t deadlineAfterNs(std::uint64_t duration_ns);

/// Nanoseconds since 1970-01-01 00:00 UTC on the wall clock, which may jump either way.
[[nodiscard]] std::int64_t wallClockNs();

void sleepNs(std::uint64_t duration_ns);

/// Not for secrets: pauses, spreading, schedule choices.
[[nodiscard]] std::uint64_t randomNumber();

/// Per-thread storage for the few facts that belong to the running thread. Starts null in every
/// thread; nothing is freed when the thread ends.
enum class ThreadSlot { kCurrentQueue, kCurrentConnection, kPoolWorker, kBorrowedThread, kCount };
[[nodiscard]] void*& threadSlot(ThreadSlot slot);

/// Something that may keep alive what keeps it alive. Of a simulated schedule that was cut off
/// nothing goes on that would end this, so whoever clears it away has each that is left let go
/// (letKeepersGo()). A process on real threads that is cut off is gone, and nothing is called.
class Keeper {
 public:
  Keeper(const Keeper&) = delete;
  Keeper& operator=(const Keeper&) = delete;
  virtual void letGo() = 0;

 protected:
  Keeper();
  ~Keeper();
};

/// Ends the process after writing `reason` to standard error. For broken invariants of the program
/// itself, never for bad input.
[[noreturn]] void panic(const char* reason);

}  // namespace spacekeep::rt
