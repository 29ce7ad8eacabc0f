#include "purge/purge_operation.h"

#include <algorithm>
#include <utility>

#include "operations/info_keys.h"
#include "purge/decisions.h"
#include "support/logging/log.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

// Tells apart the two places that complain about an amount.
constexpr int kAmountCheck = 90;

constexpr double kNsPerSecond = 1'000'000'000.0;

ServiceMap purgingServices(const ServiceMap& services) {
  ServiceMap purging;
  for (const auto& [service_id, service] : services) {
    if (service->doesPurge()) purging.emplace_hint(purging.end(), service_id, service);
  }
  return purging;
}

}  // namespace

bool SpacekeepPurgeOperation::initWithInfo(const Value& request, ServiceSnapshot snapshot) {
  if (!SpacekeepOperation::initWithInfo(request, std::move(snapshot))) return false;
  setServices(purgingServices(services()));
  setPurge_amount_needed(unsignedAt(info(), keys::kAmount).value_or(0));
  setPurge_amount_reported(0);
  setViable_purging_services(services().size());
  finish_early_ = truthAt(info(), keys::kFinishEarly);
  return true;
}

void SpacekeepPurgeOperation::startOperation(OperationCompletion completion) {
  Run run{.outcome = std::make_shared<PurgeOutcome>(info()),
          .completion = std::move(completion),
          .user_timeout_seconds = readUserTimeoutSeconds(),
          .start_ticks = 0};
  if (!takeAmountNeeded(run)) return;
  const std::uint64_t freespace_bytes =
      platform().volumes.volumeFreespace(info().find(keys::kVolume));
  collection_queue()->sync([&] { run.outcome->beginMeasuring(freespace_bytes); });
  logTrace("%s urgencyLimit: %d, info at start: %@", "startOperation", urgencyLimit(), result());
  setPurge_amount_reported(0);
  run.start_ticks = rt::ticks();
  runUrgencies(run);
  finish(run);
}

std::uint64_t SpacekeepPurgeOperation::readUserTimeoutSeconds() const {
  const std::uint64_t asked_seconds = unsignedAt(info(), keys::kPurgeTimeout).value_or(0);
  logTrace("%s user_timeout_seconds: %llu", "startOperation", asked_seconds);
  return std::min(asked_seconds, purge::kMaxUserTimeoutSeconds);
}

bool SpacekeepPurgeOperation::takeAmountNeeded(const Run& run) {
  const Value* amount = result().find(keys::kAmount);
  if (amount != nullptr && amount->isNumber()) {
    setPurge_amount_needed(amount->asUnsigned().value_or(0));
    return true;
  }
  logProblem("%s %d amount is not a number: %@", "startOperation", kAmountCheck, amount);
  Dictionary refusal;
  collection_queue()->sync([&] {
    run.outcome->replaceWithError("Parameter error, no Amount key in info dict");
    refusal = run.outcome->snapshot();
  });
  if (run.completion) run.completion(refusal);
  return false;
}

void SpacekeepPurgeOperation::finish(const Run& run) {
  const std::uint64_t freed_bytes = amountPurged(*run.outcome);
  const double elapsed_ns = elapsedNs(run.start_ticks, rt::ticks());
  addDistribution(elapsed_ns, "SpacekeepPurgeElapsedNanoseconds");
  setPurge_semaphore(nullptr);
  cancelIfShort(freed_bytes);
  fillOutcome(run, freed_bytes, elapsed_ns);
  Dictionary outcome;
  collection_queue()->sync([&] {
    outcome = run.outcome->snapshot();
    reported_at_end_ = reported_by_service_;
  });
  logTrace("%s result %@", "startOperation", outcome);
  countShortfall(freed_bytes);
  if (run.completion) run.completion(outcome);
}

void SpacekeepPurgeOperation::cancelIfShort(std::uint64_t freed_bytes) {
  if (inFlightCount() == 0 || freed_bytes >= purge_amount_needed()) return;
  logProblem("%s cancelling purge", "startOperation");
  cancelOperation();
}

void SpacekeepPurgeOperation::fillOutcome(const Run& run, std::uint64_t freed_bytes,
                                          double elapsed_ns) {
  collection_queue()->sync([&] {
    run.outcome->set(keys::kAmountReported, purge_amount_reported());
    run.outcome->set(keys::kElapsedTime, elapsed_ns / kNsPerSecond);
  });
  addDistribution(static_cast<double>(freed_bytes), "SpacekeepPurgeAmountPurged");
  reportPercentageForAmountRequested(purge_amount_needed(), freed_bytes, "total");
  const std::uint64_t freespace_bytes =
      platform().volumes.volumeFreespace(info().find(keys::kVolume));
  collection_queue()->sync([&] {
    run.outcome->set(keys::kAmount, freed_bytes);
    // Read again, so that a reply that has arrived meanwhile is counted.
    run.outcome->set(keys::kAmountReported, purge_amount_reported());
    run.outcome->set(keys::kFreespaceEnd, freespace_bytes);
  });
}

void SpacekeepPurgeOperation::countShortfall(std::uint64_t freed_bytes) const {
  if (freed_bytes >= purge_amount_needed()) return;
  platform().statistics.addReportStat(kStatisticsDomain, "SpacekeepPurgeFailed", 1);
  addDistribution(static_cast<double>(purge_amount_needed() - freed_bytes),
                  "SpacekeepPurgeDeficit");
}

// Measured from the volume and its beginning alone: the rest of the outcome can hold a record for
// each of many services, and this runs once for each of them.
std::uint64_t SpacekeepPurgeOperation::amountPurged(const PurgeOutcome& outcome) const {
  return platform().volumes.amountPurged(outcome.measure());
}

void SpacekeepPurgeOperation::addDistribution(double value, const std::string& key) const {
  platform().statistics.addDistributionStat(value, kStatisticsDomain, key);
}

}  // namespace spacekeep
