#include "support/ipc/linux/refusal_log.h"

#include <systemd/sd-event.h>
#include <time.h>

#include <algorithm>
#include <utility>

#include "support/logging/log.h"

namespace spacekeep::ipc {

namespace {

constexpr const char* kOperation = "SpacekeepListener";

}  // namespace

void RefusalLog::write(std::string_view who, std::string_view why, std::string_view what) {
  if (!mayWrite()) return;
  if (kind_ == Of::kCalls) {
    logProblem("%s %@ of %@ refused: %@", kOperation, what, who, why);
  } else {
    logProblem("%s Connection of %@ refused or ended: %@", kOperation, who, why);
  }
}

bool RefusalLog::mayWrite() {
  if (closed_) return true;
  if (window_end_ == nullptr) {
    const std::uint64_t usec = std::max<std::uint64_t>(window_ns_ / 1000, 1);
    if (sd_event_add_time_relative(loop_.event(), &window_end_, CLOCK_MONOTONIC, usec, 0,
                                   &RefusalLog::onWindowEnd, this) < 0) {
      return true;  // without a clock nothing is left out
    }
    written_ = 0;
  }
  if (written_ < kLinesPerWindow) {
    ++written_;
    return true;
  }
  ++left_out_;
  return false;
}

int RefusalLog::onWindowEnd(sd_event_source*, std::uint64_t, void* self) {
  static_cast<RefusalLog*>(self)->endWindow();
  return 0;
}

void RefusalLog::close() {
  closed_ = true;
  endWindow();
}

void RefusalLog::endWindow() {
  window_end_ = sd_event_source_disable_unref(window_end_);
  const std::uint64_t left_out = std::exchange(left_out_, 0);
  if (left_out == 0) return;
  if (kind_ == Of::kCalls) {
    logProblem("%s %llu more calls were refused", kOperation, left_out);
  } else {
    logProblem("%s %llu more connections were refused or ended", kOperation, left_out);
  }
}

}  // namespace spacekeep::ipc
