#include "ctl/check_service/check_progress.h"

#include <fmt/core.h>

#include <cstdio>
#include <utility>

#include "ctl/check_service/patience.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {

CheckProgress::CheckProgress(bool wanted, std::string name, std::size_t columns)
    : name_(std::move(name)), columns_(columns) {
  if (wanted) thread_ = rt::Thread("progress", [this] { show(); });
}

CheckProgress::~CheckProgress() {
  if (!thread_.joinable()) return;
  over_.signal();
  thread_.join();
}

void CheckProgress::show() {
  unsigned seconds = 0;
  while (over_.waitForNs(kSecondNs) == WaitResult::kTimedOut) {
    const std::string text = fmt::format("{} ... {} s", name_, ++seconds);
    fmt::print(stderr, "\r\x1b[K{}", shortened(text, columns_ - 1));
    std::fflush(stderr);
  }
  if (seconds > 0) fmt::print(stderr, "\r\x1b[K");
  std::fflush(stderr);
}

}  // namespace spacekeep::ctl
