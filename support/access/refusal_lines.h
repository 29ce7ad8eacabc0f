// Thread safety: every member may be called from any thread.
//
// How many log lines about refusals go out. Whoever may not connect can try as often as it likes,
// each time as a new peer, so only so many lines are written in a while.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <string_view>
#include <utility>

#include "support/runtime/runtime.h"

namespace spacekeep::access {

class RefusalLines {
 public:
  static constexpr std::uint64_t kWindowNs = 10'000'000'000;
  /// Of one user and entitlement in a window, so that one user's flood hides nobody else.
  static constexpr unsigned kLinesOfOne = 20;
  /// Of all together: a user can have very many numbers, in a user namespace of its own.
  static constexpr unsigned kLinesOfAll = 100;

  /// Whether a line may be written now. When it may not, it is counted.
  [[nodiscard]] bool admit(std::uint32_t user, std::string_view entitlement);
  /// Once a window is over: logs how many lines were left out in it.
  void tellLeftOut();

 private:
  /// Answers how many lines were left out in the window that has ended, 0 while it goes on.
  std::uint64_t endWindow();

  rt::Mutex mutex_;
  // Protected by mutex_.
  std::uint64_t window_ends_ = 0;  // in ticks
  std::map<std::pair<std::uint32_t, std::string>, unsigned> written_;
  unsigned written_in_all_ = 0;
  std::uint64_t left_out_ = 0;
};

}  // namespace spacekeep::access
