// Thread safety: once, at start-up.
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

}  // namespace spacekeep
