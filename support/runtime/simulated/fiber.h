// Thread safety: fibers belong to the one thread that runs the schedule.
//
// One thread of control of a schedule.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/context.h"

namespace spacekeep::rt::simulated {

enum class FiberState { kRunnable, kBlocked, kFinished };

/// What a blocked fiber waits for.
enum class WaitKind { kLock, kNotification, kJoin, kSleep };

inline constexpr std::uint32_t kNoFiber = UINT32_MAX;

struct Fiber {
  Fiber(std::uint32_t id_given, std::string name_given, std::function<void()> body_given,
        Stack stack, void (*entry)())
      : id(id_given),
        name(std::move(name_given)),
        body(std::move(body_given)),
        context(stack, entry) {}

  const std::uint32_t id;  ///< in order of creation, 0 is the schedule's own body
  const std::string name;
  std::function<void()> body;
  Context context;
  FiberState state = FiberState::kRunnable;
  std::uint64_t priority = 0;  ///< for priority schedules
  std::size_t runnable_index = 0;
  std::array<void*, static_cast<std::size_t>(ThreadSlot::kCount)> slots{};

  // While blocked.
  WaitKind waits_for = WaitKind::kLock;
  std::uint32_t waits_on = kNoFiber;         ///< id of the lock's holder, or of whom it joins
  std::vector<Fiber*>* wait_list = nullptr;  ///< where it stands, if anywhere
  std::uint64_t deadline_ticks = kNever;
  bool deadline_passed = false;  ///< how the last wait ended

  std::vector<Fiber*> joiners;

  // While left-over fibers are unwound.
  bool told_to_unwind = false;
  unsigned fruitless_wakes = 0;
  unsigned locks_while_unwinding = 0;
};

using WaitList = std::vector<Fiber*>;

}  // namespace spacekeep::rt::simulated
