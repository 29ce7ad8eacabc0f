// Thread safety: all contexts belong to the one thread that runs the schedule.
//
// A stack that can be left and entered again: all that makes a fiber.
#pragma once

#include <ucontext.h>

#include <cstddef>

#include "support/runtime/simulated/stack_pool.h"

// The hand-written switch costs a few nanoseconds; swapcontext(3) makes a system call each time.
#if defined(__x86_64__) && !defined(SPACEKEEP_RT_UCONTEXT)
#define SPACEKEEP_RT_FAST_SWITCH 1
#endif

namespace spacekeep::rt::simulated {

class Context {
 public:
  /// The stack of the caller.
  Context() = default;
  /// `entry` starts on `stack` at the first switch and must never return.
  Context(Stack stack, void (*entry)());
  Context(const Context&) = delete;
  Context& operator=(const Context&) = delete;

  /// Leaves this context, which must be the running one, until somebody switches back to it.
  void switchTo(Context& next);
  /// As switchTo, for good.
  void leaveTo(Context& next);
  /// The first thing `entry` does.
  static void arrive();

  [[nodiscard]] Stack stack() const { return stack_; }

 private:
  // The exceptions in flight and in handlers belong to a stack, but the language runtime keeps them
  // by thread (Itanium C++ ABI, 2.2.2: __cxa_eh_globals).
  struct ExceptionState {
    void* caught = nullptr;
    unsigned uncaught = 0;
  };

  void exchangeExceptions(const Context& next);
  void jumpTo(Context& next);

  Stack stack_;
  void* fake_stack_ = nullptr;
  ExceptionState exceptions_;
#if defined(SPACEKEEP_RT_FAST_SWITCH)
  void* stack_pointer_ = nullptr;
#else
  ucontext_t registers_{};
#endif
};

}  // namespace spacekeep::rt::simulated
