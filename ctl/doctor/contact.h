// Thread safety: for one thread.
//
// What came of talking to the daemon.
#pragma once

#include <string>

#include "ctl/complaint.h"
#include "support/values/value.h"

namespace spacekeep::ctl::doctor {

struct Contact {
  enum class Outcome { kNone, kAnswers, kRefused, kSilent };
  Outcome outcome = Outcome::kNone;
  CommonOptions common;   ///< with the socket that was tried
  Dictionary state = {};  ///< the daemon's settings, when it answers

  [[nodiscard]] bool answers() const { return outcome == Outcome::kAnswers; }
};

}  // namespace spacekeep::ctl::doctor
