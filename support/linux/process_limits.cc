#include "support/linux/process_limits.h"

#include <malloc.h>
#include <sys/resource.h>

namespace spacekeep {

void raiseDescriptorLimit() {
  rlimit files{};
  if (getrlimit(RLIMIT_NOFILE, &files) != 0) return;
  files.rlim_cur = files.rlim_max;
  static_cast<void>(setrlimit(RLIMIT_NOFILE, &files));
}

void giveBackFreeMemory() { static_cast<void>(malloc_trim(0)); }

void limitHeapArenas() { static_cast<void>(mallopt(M_ARENA_MAX, kHeapArenas)); }

}  // namespace spacekeep
