#include "support/access/refusal_lines.h"

#include <mutex>
#include <utility>

#include "support/logging/log.h"

namespace spacekeep::access {
namespace {

constexpr const char* kOperation = "connectionIsEntitled";

}  // namespace

bool RefusalLines::admit(std::uint32_t user, std::string_view entitlement) {
  tellLeftOut();
  bool is_first = false;
  {
    const std::scoped_lock lock(mutex_);
    // Nobody gets an entry whose line is not written, so there are as few entries as lines.
    if (written_in_all_ < kLinesOfAll) {
      unsigned& written = written_[{user, std::string(entitlement)}];
      if (written < kLinesOfOne) {
        ++written;
        ++written_in_all_;
        return true;
      }
    }
    is_first = ++left_out_ == 1;
  }
  // At once, and not with the count alone: after a flood there may be no further line for long.
  if (is_first) {
    logProblem("%s user %u is refused %s: for a while such lines are counted and not written",
               kOperation, user, entitlement);
  }
  return false;
}

void RefusalLines::tellLeftOut() {
  const std::uint64_t left_out = endWindow();
  if (left_out == 0) return;
  logProblem("%s %llu more refusals were not written", kOperation, left_out);
}

std::uint64_t RefusalLines::endWindow() {
  const std::scoped_lock lock(mutex_);
  if (rt::ticks() < window_ends_) return 0;
  window_ends_ = rt::deadlineAfterNs(kWindowNs);
  written_.clear();
  written_in_all_ = 0;
  return std::exchange(left_out_, 0);
}

}  // namespace spacekeep::access
