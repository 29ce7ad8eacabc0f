// "SPACEKEEP_FINISH_EARLY": a purge that asks for it ends as soon as the amount is reached and no
// service is at work for it.
#include "operations/info_keys.h"
#include "purge/purge_operation.h"

namespace spacekeep {

void SpacekeepPurgeOperation::setFinishEarlyByDefault(bool finish_early) {
  if (!info().contains(keys::kFinishEarly)) finish_early_ = finish_early;
}

// A service whose share was 0 stands in flight without having been asked: there is no answer to
// wait for.
bool SpacekeepPurgeOperation::finishedEarly(const PurgeOutcome& outcome) const {
  if (!finish_early_) return false;
  // Read in this order: a service joins the set before it is counted as not asked.
  const std::uint64_t unasked = unasked_in_flight_;
  return inFlightCount() <= unasked && amountPurged(outcome) >= purge_amount_needed();
}

void SpacekeepPurgeOperation::endWaitIfFinishedEarly(const PurgeOutcome& outcome) const {
  if (!finishedEarly(outcome)) return;
  if (const auto semaphore = purge_semaphore()) semaphore->signal();
}

}  // namespace spacekeep
