#include "ctl/query_display.h"

#include <fmt/core.h>

#include <cmath>

#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr double kSilentSeconds = 1;
/// Ten for the services and something for the stragglers; what is beyond is other queries' time.
constexpr double kLongestQuerySeconds = 12;

}  // namespace

std::optional<std::string> queryProgressText(const std::string& volume, double elapsed_seconds) {
  if (elapsed_seconds < kSilentSeconds) return std::nullopt;
  const bool in_time = elapsed_seconds < kLongestQuerySeconds;
  return fmt::format("{:.0f} s, {} {}", std::floor(elapsed_seconds),
                     in_time ? "asking the services about" : "the daemon is busy; waiting for",
                     harmless(volume));
}

QueryDisplay::~QueryDisplay() {
  if (shown_) fmt::print(stream_, "\r\x1b[K");
}

void QueryDisplay::show(double elapsed_seconds) {
  if (stream_ == nullptr) return;
  const auto text = queryProgressText(volume_, elapsed_seconds);
  if (!text) return;
  shown_ = true;
  fmt::print(stream_, "\r\x1b[K{}", shortened(*text, columns_ - 1));
  std::fflush(stream_);
}

}  // namespace spacekeep::ctl
