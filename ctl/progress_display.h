// Thread safety: for one thread at a time.
//
// Shows the progress of a purge while it runs: one line that renews itself on a terminal, a line
// per urgency elsewhere.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>

#include "ctl/progress.h"

namespace spacekeep::ctl {

class ProgressDisplay {
 public:
  enum class Kind { kNone, kTerminal, kLines };

  /// `columns`: a line on a terminal is cut to fit, since it could not renew itself otherwise.
  ProgressDisplay(Kind kind, PurgePlan plan, std::string volume, std::FILE* stream,
                  std::size_t columns);
  /// Takes the terminal's line away.
  ~ProgressDisplay();
  ProgressDisplay(const ProgressDisplay&) = delete;
  ProgressDisplay& operator=(const ProgressDisplay&) = delete;

  void show(double elapsed_seconds);

 private:
  void showLine(const std::string& text, double elapsed_seconds);

  const Kind kind_;
  const PurgePlan plan_;
  const std::string volume_;
  std::FILE* const stream_;
  const std::size_t columns_;
  const std::optional<std::uint64_t> free_at_start_;
  std::optional<int> last_step_;  ///< what the last line was written for
};

}  // namespace spacekeep::ctl
