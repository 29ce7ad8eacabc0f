// Thread safety: constants only.
//
// How much stack a thread of this system gets, on either runtime. Hundreds of threads may wait at
// once, so stacks are small; the address sanitizer's padding and unoptimised frames need more.
#pragma once

#include <cstddef>

namespace spacekeep::rt {

#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
#define SPACEKEEP_RT_SANITIZED 1
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer) || \
    __has_feature(memory_sanitizer)
#define SPACEKEEP_RT_SANITIZED 1
#endif
#endif

#if defined(SPACEKEEP_RT_SANITIZED)
inline constexpr std::size_t kThreadStackBytes = std::size_t{2} * 1024 * 1024;
#elif defined(NDEBUG)
inline constexpr std::size_t kThreadStackBytes = std::size_t{256} * 1024;
#else
inline constexpr std::size_t kThreadStackBytes = std::size_t{1024} * 1024;
#endif

}  // namespace spacekeep::rt
