// Thread safety: every function may be called from any thread.
//
// The address sanitizer has to be told about every change of stacks. Without it these are no-ops.
#pragma once

#include <cstddef>

#if defined(__SANITIZE_ADDRESS__)
#define SPACEKEEP_RT_ASAN 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer)
#define SPACEKEEP_RT_ASAN 1
#endif
#endif

#if defined(SPACEKEEP_RT_ASAN)
#include <sanitizer/asan_interface.h>
#include <sanitizer/common_interface_defs.h>
#include <sanitizer/lsan_interface.h>
#endif

namespace spacekeep::rt::simulated {

/// Before a switch to the stack [bottom, bottom + bytes). `fake_stack` keeps the state of the stack
/// that is left; null when it is left for good.
inline void beforeSwitch([[maybe_unused]] void** fake_stack, [[maybe_unused]] const void* bottom,
                         [[maybe_unused]] std::size_t bytes) {
#if defined(SPACEKEEP_RT_ASAN)
  __sanitizer_start_switch_fiber(fake_stack, bottom, bytes);
#endif
}

/// After a switch, on the new stack; tells which stack was left.
inline void afterSwitch([[maybe_unused]] void* fake_stack,
                        [[maybe_unused]] const void** left_bottom,
                        [[maybe_unused]] std::size_t* left_bytes) {
#if defined(SPACEKEEP_RT_ASAN)
  __sanitizer_finish_switch_fiber(fake_stack, left_bottom, left_bytes);
#endif
}

inline void unpoison([[maybe_unused]] const void* bottom, [[maybe_unused]] std::size_t bytes) {
#if defined(SPACEKEEP_RT_ASAN)
  __asan_unpoison_memory_region(bottom, bytes);
#endif
}

/// What an abandoned stack refers to is kept on purpose and is no leak.
inline void keepReachable([[maybe_unused]] const void* bottom, [[maybe_unused]] std::size_t bytes) {
#if defined(SPACEKEEP_RT_ASAN)
  __lsan_register_root_region(bottom, bytes);
#endif
}

}  // namespace spacekeep::rt::simulated
