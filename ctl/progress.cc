#include "ctl/progress.h"

#include <fmt/core.h>

#include <cmath>

#include "ctl/size_text.h"

namespace spacekeep::ctl {
namespace {

double waitOf(const PurgePlan& plan, int urgency) {
  return plan.timeout_seconds ? static_cast<double>(*plan.timeout_seconds) : 2.0 * urgency;
}

}  // namespace

UrgencyEstimate estimateUrgency(const PurgePlan& plan, double elapsed_seconds) {
  UrgencyEstimate estimate;
  double end_of_urgency = 0;
  for (int urgency = 1; urgency <= plan.urgency_limit; ++urgency) {
    if (end_of_urgency <= elapsed_seconds) estimate.urgency = urgency;
    end_of_urgency += waitOf(plan, urgency);
  }
  estimate.all_waits_over = elapsed_seconds >= end_of_urgency;
  estimate.seconds_left = estimate.all_waits_over ? 0 : end_of_urgency - elapsed_seconds;
  return estimate;
}

std::string progressText(const PurgePlan& plan, double elapsed_seconds,
                         std::optional<std::uint64_t> gained_bytes) {
  const std::string asked = printSize(plan.asked_bytes);
  const std::string gained = gained_bytes
                                 ? fmt::format("{} of {} gained", printSize(*gained_bytes), asked)
                                 : fmt::format("{} asked for", asked);
  const UrgencyEstimate estimate = estimateUrgency(plan, elapsed_seconds);
  if (estimate.all_waits_over) {
    return fmt::format("{}, waiting for the daemon (it may be busy with other purges)", gained);
  }
  return fmt::format("{}, urgency {} of {}, at most {:.0f} s left", gained, estimate.urgency,
                     plan.urgency_limit, std::ceil(estimate.seconds_left));
}

}  // namespace spacekeep::ctl
