#include "support/ipc/linux/refusal_log.h"

#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

void RefusalLog::write(const std::string& who, const std::string& why) {
  constexpr const char* kOperation = "SpacekeepListener";
  if (rt::ticks() >= window_ends_) {
    if (left_out_ > 0) {
      logProblem("%s %llu more connections were refused or ended", kOperation, left_out_);
    }
    window_ends_ = rt::deadlineAfterNs(kWindowNs);
    written_ = 0;
    left_out_ = 0;
  }
  if (written_ >= kLinesPerWindow) {
    ++left_out_;
    return;
  }
  ++written_;
  logProblem("%s Connection of %@ refused or ended: %@", kOperation, who, why);
}

}  // namespace spacekeep::ipc
