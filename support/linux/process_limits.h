// Thread safety: once, at start-up.
//
// What the kernel lets this process use up.
#pragma once

namespace spacekeep {

/// Raises the soft limit of open descriptors to the hard limit (setrlimit(2)): a thousand services
/// hold two each. A refusal leaves the limit as it is.
void raiseDescriptorLimit();

}  // namespace spacekeep
