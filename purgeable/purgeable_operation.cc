#include "purgeable/purgeable_operation.h"

#include <algorithm>
#include <limits>
#include <utility>

#include "operations/info_keys.h"
#include "support/logging/log.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kFirstWaitNs = 10'000'000'000;
constexpr double kNsPerSecond = 1'000'000'000.0;
constexpr std::int64_t kOptOutPeriodNs = 120'000'000'000;

// Tells apart the places that complain about a number.
constexpr int kAmountCheck = 163;

bool isQueried(const SKService& service) { return service.doesPurge() && !service.doNotQuery(); }

ServiceSnapshot queriedServices(const ServiceSnapshot& snapshot) {
  ServiceMap queried;
  for (const auto& [service_id, service] : *snapshot) {
    if (isQueried(*service)) queried.emplace_hint(queried.end(), service_id, service);
  }
  return queried;
}

// Sums stay at the ends of their range instead of wrapping round.
std::int64_t saturatingSum(std::int64_t one, std::int64_t other) {
  using Limits = std::numeric_limits<std::int64_t>;
  std::int64_t sum = 0;
  if (!__builtin_add_overflow(one, other, &sum)) return sum;
  return other < 0 ? Limits::min() : Limits::max();
}

std::int64_t totalOf(const Dictionary& amounts) {
  std::int64_t total = 0;
  for (const auto& [service_id, amount] : amounts) {
    if (const auto bytes = amount.asSigned()) {
      total = saturatingSum(total, *bytes);
    } else {
      logProblem("%s %d %@ num is not a number: %@", "startOperation", kAmountCheck, service_id,
                 amount);
    }
  }
  return total;
}

Value listOf(const std::set<std::string>& service_ids) {
  return Array(service_ids.begin(), service_ids.end());
}

// The one memory does not tell at which urgency somebody answered. Whoever compares urgencies asks
// for one that does, and leaves the answers of everybody else alone.
std::string memoryKeyFor(const Dictionary& info, std::int32_t urgency) {
  if (!truthAt(info, keys::kExactUrgency)) return keys::kRecentServiceStats;
  return keys::kRecentServiceStatsAtUrgency + std::to_string(urgency);
}

}  // namespace

bool SpacekeepPurgeableOperation::initWithInfo(const Value& request, ServiceSnapshot snapshot) {
  const bool all_queried =
      std::ranges::all_of(*snapshot, [](const auto& entry) { return isQueried(*entry.second); });
  if (!all_queried) snapshot = queriedServices(snapshot);
  if (!SpacekeepOperation::initWithInfo(request, std::move(snapshot))) return false;
  memory_key_ = memoryKeyFor(info(), urgencyLimit());
  return true;
}

SpacekeepPurgeableOperation::Self SpacekeepPurgeableOperation::self() {
  return std::static_pointer_cast<SpacekeepPurgeableOperation>(shared_from_this());
}

void SpacekeepPurgeableOperation::startOperation(OperationCompletion completion) {
  const Dictionary working_copy = info();
  const std::uint64_t start_ticks = rt::ticks();
  logTrace("%s ENTRY, info: %@", "startOperation", working_copy);
  askServices(working_copy, recentAnswers(working_copy, Wanted::kToQueryAsWell).to_query);
  if (!nobodyInFlight()) waitForServices();

  // Whom to ask is only for the log from here on.
  const bool traces = shouldLogTrace(getLogHandle());
  const Recent second_pass =
      recentAnswers(working_copy, traces ? Wanted::kToQueryAsWell : Wanted::kToCount);
  if (traces) logTrace("%s cachedInfo (2nd pass): %@", "startOperation", infoOf(second_pass));
  Dictionary result = resultFrom(*second_pass.to_count);
  if (shouldLogTrace(getLogHandle())) {
    logTrace("%s Still in flight: %@", "startOperation", listOf(copyInFlight()));
  }
  logTrace("%s elapsed time: %f result: %@", "startOperation",
           elapsedNs(start_ticks, rt::ticks()) / kNsPerSecond, result);
  completion(std::move(result));
}

// Whoever is asked is in flight before its task starts, so nobody is missed by the wait that
// follows.
void SpacekeepPurgeableOperation::askServices(const Dictionary& working_copy,
                                              const Array& service_ids) {
  if (service_ids.empty()) return;
  const auto request = std::make_shared<const Dictionary>(working_copy);
  const auto group = std::make_shared<TaskGroup>();
  for (const Value& value : service_ids) {
    const std::string& service_id = *value.string();
    if (optOutService(service_id, false)) continue;
    if (!updateInFlight(service_id, true)) continue;
    // The wait may end before the task has run.
    asyncInGroup(group, platform().global,
                 [self = self(), request, service = serviceFor(service_id)] {
                   self->queryService(service, request);
                 });
  }
  static_cast<void>(group->waitForNs(kFirstWaitNs));
}

// What is no number stays in the itemized entries; only the total goes without it.
Dictionary SpacekeepPurgeableOperation::resultFrom(const Dictionary& amounts) const {
  Dictionary result = amounts;
  result.set(keys::kTotalAvailable, totalOf(amounts));
  result.set(keys::kVolume, *volume());
  return result;
}

bool SpacekeepPurgeableOperation::optOutService(const std::string& service_id, bool add) {
  bool opted_out = false;
  collection_queue()->sync([&] {
    const std::int64_t now_ns = rt::wallClockNs();
    if (add) {
      opt_outs_.insert_or_assign(service_id, Date{now_ns});
      return;
    }
    const auto found = opt_outs_.find(service_id);
    if (found == opt_outs_.end()) return;
    opted_out = now_ns - found->second.unix_ns < kOptOutPeriodNs;
    if (!opted_out) opt_outs_.erase(found);
  });
  return opted_out;
}

}  // namespace spacekeep
