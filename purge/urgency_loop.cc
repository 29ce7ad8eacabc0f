// One urgency after another: ask, wait, record.
#include <utility>

#include "operations/info_keys.h"
#include "purge/decisions.h"
#include "purge/purge_operation.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

Array arrayOf(const std::set<std::string>& service_ids) {
  return Array(service_ids.begin(), service_ids.end());
}

}  // namespace

// There is no early end when the amount is reached: the later urgencies then ask nobody and wait
// out their time. A request opts out of that with "SPACEKEEP_FINISH_EARLY".
void SpacekeepPurgeOperation::runUrgencies(const Run& run) {
  const auto limit = static_cast<std::uint32_t>(urgencyLimit());
  for (std::uint32_t urgency = 1; urgency <= limit; ++urgency) {
    if (runUrgency(run, static_cast<std::int32_t>(urgency)) == Pass::kStop) return;
  }
}

SpacekeepPurgeOperation::Pass SpacekeepPurgeOperation::runUrgency(const Run& run,
                                                                  std::int32_t urgency) {
  auto record = std::make_shared<UrgencyRecord>();
  if (cancel()) {
    collection_queue()->sync([&] { run.outcome->set(keys::kOperationCancelled, true); });
    return Pass::kStop;
  }
  if (finishedEarly(*run.outcome)) return Pass::kStop;
  setPurge_semaphore(std::make_shared<CountingSemaphore>(0));
  logTrace("%s IN QUEUE, amountPurged: %llu", "startOperation", amountPurged(*run.outcome));
  addDistribution(static_cast<double>(purge_amount_needed()), "SpacekeepPurgeAmountRequested");
  if (amountPurged(*run.outcome) < purge_amount_needed()) askServices(run, urgency, record);
  endWaitIfFinishedEarly(*run.outcome);
  waitForServices(run, urgency, record);
  // After the wait, so that the next urgency divides only among services that have answered.
  setViable_purging_services(services().size() - inFlightCount());
  recordStatistics(run, urgency, record);
  return Pass::kGoOn;
}

// The queue is held while the requests are queued, so that every request of this urgency stands in
// it before the first one computes its share.
void SpacekeepPurgeOperation::askServices(const Run& run, std::int32_t urgency,
                                          const std::shared_ptr<UrgencyRecord>& record) {
  logTrace("%s Urgency: %d", "startOperation", urgency);
  message_queue()->suspend();
  for (const auto& entry : services()) {
    queueServiceRequest(entry.second, run.outcome, urgency, record, run.completion);
  }
  message_queue()->resume();
}

void SpacekeepPurgeOperation::waitForServices(const Run& run, std::int32_t urgency,
                                              const std::shared_ptr<UrgencyRecord>& record) {
  const std::uint64_t wait_seconds = purge::waitSeconds(run.user_timeout_seconds, urgency);
  logTrace("%s waiting for %llu seconds, user_timeout_seconds: %llu, currentUrgency: %d",
           "startOperation", wait_seconds, run.user_timeout_seconds, urgency);
  const auto semaphore = purge_semaphore();
  if (semaphore->waitForNs(wait_seconds * purge::kNsPerSecond) == WaitResult::kSignalled) return;
  collection_queue()->sync([&] { recordTimeout(*record, urgency, wait_seconds); });
}

void SpacekeepPurgeOperation::recordTimeout(UrgencyRecord& record, std::int32_t urgency,
                                            std::uint64_t wait_seconds) {
  const Value in_flight = arrayOf(inFlight());
  record.set(keys::kServicesInFlight, in_flight);
  logProblem("%s timed out waiting for: %@", "startOperation", in_flight);
  record.set(purge::urgencyTimeoutKey(urgency), wait_seconds);
}

void SpacekeepPurgeOperation::recordStatistics(const Run& run, std::int32_t urgency,
                                               const std::shared_ptr<UrgencyRecord>& record) {
  const std::string key = purge::urgencyStatsKey(urgency);
  const std::string text = purge::urgencyStatsText(
      purge_amount_reported(), amountPurged(*run.outcome), purge_amount_needed(), cancel());
  logTrace("%s %@ : %@", "startOperation", key, text);
  collection_queue()->sync([&] {
    record->set(key, text);
    run.outcome->attach(purge::urgencyInfoKey(urgency), record);
  });
}

}  // namespace spacekeep
