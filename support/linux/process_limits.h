// Thread safety: once, at start-up, but for what says otherwise.
//
// What this process may use up.
#pragma once

namespace spacekeep {

/// Raises the soft limit of open descriptors to the hard limit (setrlimit(2)): a thousand services
/// hold two each. A refusal leaves the limit as it is.
void raiseDescriptorLimit();

inline constexpr int kHeapArenas = 2;

/// Keeps the C library from giving each thread a heap of its own (mallopt(3)). A hundred threads that
/// wait for services would spread what they leave behind over eight heaps for each processor, and
/// none of it would be given back.
void limitHeapArenas();

/// Gives the pages back that lie free between what is in use (malloc_trim(3)). A heap is as large as
/// it ever had to be otherwise, as long as one small block near its end is in use. May be called
/// from any thread; takes some milliseconds.
void giveBackFreeMemory();

}  // namespace spacekeep
