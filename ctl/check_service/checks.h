// Thread safety: constants, and functions for one thread.
//
// The checks, in the order in which they are made. Each looks at one thing, so that one fault of a
// service fails one check.
#pragma once

#include <string>
#include <vector>

#include "ctl/check_service/bench.h"
#include "ctl/check_service/finding.h"

namespace spacekeep::ctl {

struct Check {
  const char* name;     ///< stable; scripts and people refer to it
  const char* meaning;  ///< what a good service does
  bool purges;          ///< asks the service to give up data
  bool summing_up;      ///< looks at what the other checks have noted
  Finding (*run)(Bench& bench);
};

[[nodiscard]] const std::vector<Check>& allChecks();

// What needs no data to be given up.
[[nodiscard]] Finding checkPing(Bench& bench);
[[nodiscard]] Finding checkQueryFreesNothing(Bench& bench);
[[nodiscard]] Finding checkQueryAmounts(Bench& bench);
[[nodiscard]] Finding checkQueryUrgencies(Bench& bench);
[[nodiscard]] Finding checkUnknownVolume(Bench& bench);
[[nodiscard]] Finding checkOtherMembers(Bench& bench);
[[nodiscard]] Finding checkBackToBack(Bench& bench);
[[nodiscard]] Finding checkOddRequests(Bench& bench);
[[nodiscard]] Finding checkUpkeep(Bench& bench);
[[nodiscard]] Finding checkDaemonGone(Bench& bench);

// What gives up data.
[[nodiscard]] Finding checkPurgeOfNothing(Bench& bench);
[[nodiscard]] Finding checkPurgeOfUnknownVolume(Bench& bench);
[[nodiscard]] Finding checkPurgeOfShare(Bench& bench);
[[nodiscard]] Finding checkPurgeLimit(Bench& bench);
[[nodiscard]] Finding checkCancel(Bench& bench);
[[nodiscard]] Finding checkPeriodic(Bench& bench);
[[nodiscard]] Finding checkPurgeOfEverything(Bench& bench);
[[nodiscard]] Finding checkInUse(Bench& bench);

// What is seen in all answers together.
[[nodiscard]] Finding checkAnswers(Bench& bench);
[[nodiscard]] Finding checkInTime(Bench& bench);
[[nodiscard]] Finding checkAnswersOnce(Bench& bench);
[[nodiscard]] Finding checkAnswerForm(Bench& bench);
[[nodiscard]] Finding checkHonestAmounts(Bench& bench);

}  // namespace spacekeep::ctl
