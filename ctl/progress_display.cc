#include "ctl/progress_display.h"

#include <fmt/core.h>
#include <sys/statvfs.h>

#include <utility>

namespace spacekeep::ctl {

std::optional<std::uint64_t> freeBytesOf(const std::string& path) {
  struct statvfs numbers = {};
  if (statvfs(path.c_str(), &numbers) != 0) return std::nullopt;
  return std::uint64_t{numbers.f_bavail} * numbers.f_frsize;
}

ProgressDisplay::ProgressDisplay(Kind kind, PurgePlan plan, std::string volume, std::FILE* stream)
    : kind_(kind),
      plan_(plan),
      volume_(std::move(volume)),
      stream_(stream),
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
    fmt::print(stream_, "\r\x1b[K{}", text);
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
