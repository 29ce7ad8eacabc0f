#include "ctl/progress_display.h"

#include <fmt/core.h>

#include <utility>

#include "ctl/text_layout.h"
#include "ctl/volume_space.h"

namespace spacekeep::ctl {

namespace {

std::optional<std::uint64_t> freeBytesOf(const std::string& path) {
  const auto space = measuredSpaceOf(path);
  return space ? std::optional(space->free_bytes) : std::nullopt;
}

}  // namespace

ProgressDisplay::ProgressDisplay(Kind kind, PurgePlan plan, std::string volume, std::FILE* stream,
                                 std::size_t columns)
    : kind_(kind),
      plan_(plan),
      volume_(std::move(volume)),
      stream_(stream),
      columns_(columns),
      free_at_start_(freeBytesOf(volume_)) {}

ProgressDisplay::~ProgressDisplay() {
  if (kind_ == Kind::kTerminal) fmt::print(stream_, "\r\x1b[K");
}

void ProgressDisplay::show(double elapsed_seconds) {
  if (kind_ == Kind::kNone) return;
  std::optional<std::uint64_t> gained;
  const auto free_now = freeBytesOf(volume_);
  if (free_at_start_ && free_now) {
    gained = *free_now > *free_at_start_ ? *free_now - *free_at_start_ : 0;
  }
  const std::string text = progressText(plan_, elapsed_seconds, gained);
  if (kind_ == Kind::kTerminal) {
    fmt::print(stream_, "\r\x1b[K{}", shortened(text, columns_ - 1));
    std::fflush(stream_);
  } else {
    showLine(text, elapsed_seconds);
  }
}

void ProgressDisplay::showLine(const std::string& text, double elapsed_seconds) {
  const auto estimate = estimateUrgency(plan_, elapsed_seconds);
  const int step = estimate.all_waits_over ? plan_.urgency_limit + 1 : estimate.urgency;
  if (std::exchange(last_step_, step) == step) return;
  fmt::print(stream_, "{}\n", text);
  std::fflush(stream_);
}

}  // namespace spacekeep::ctl
