// Thread safety: plain functions and values.
//
// What a process uses up, as the kernel tells.
#pragma once

#include <sys/types.h>

namespace soak {

struct Sample {
  double at_seconds = 0;  ///< monotonic
  double rss_kib = 0;
  double pss_kib = 0;
  double descriptors = 0;
  double threads = 0;
  double cpu_seconds = 0;  ///< since the process began
};

/// See proc(5). Zeros for what is not there any more.
[[nodiscard]] Sample sampleOf(pid_t pid);

}  // namespace soak
