// Thread safety: for one thread.
//
// Asks the daemon who could give how much on each volume, at each urgency.
#pragma once

#include <spacekeep/client.h>

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "ctl/complaint.h"
#include "ctl/offers.h"

namespace spacekeep::ctl {

struct SurveyProblem {
  ExitCode code = ExitCode::kFailed;
  std::string text;  ///< what is wrong, and what to do
};

struct Survey {
  std::vector<VolumeOffers> volumes;     ///< in the order asked for
  std::optional<SurveyProblem> problem;  ///< why something is missing
};

/// What is being asked, five times a second.
using ShowSurvey = std::function<void(const std::string& volume, int urgency)>;

/// Each urgency is asked for by itself (SPACEKEEP_EXACT_URGENCY), and those at which somebody was
/// late once more. With the right for it the answer tells of each service, else of totals. It ends
/// at the first answer that fails to come.
[[nodiscard]] Survey surveyOffers(sdk::Client& client, const std::vector<std::string>& volumes,
                                  const ShowSurvey& show);

/// "3 s, asking the services about /data (urgency 2 of 4)"; none in the first second.
[[nodiscard]] std::optional<std::string> surveyProgressText(const std::string& volume, int urgency,
                                                            double elapsed_seconds);

}  // namespace spacekeep::ctl
