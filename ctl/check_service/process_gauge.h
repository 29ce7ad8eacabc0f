// Thread safety: pure function over /proc.
//
// What another process has in use.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <optional>

namespace spacekeep::ctl {

struct ProcessUse {
  std::uint64_t descriptors = 0;
  std::uint64_t memory_bytes = 0;  ///< resident and its own (RssAnon of proc(5))
  std::uint64_t threads = 0;
};

/// None when there is no such process or this user may not look at it.
[[nodiscard]] std::optional<ProcessUse> useOf(pid_t pid);

}  // namespace spacekeep::ctl
