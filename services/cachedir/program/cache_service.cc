#include "services/cachedir/program/cache_service.h"

#include "support/logging/log.h"

namespace spacekeep::cachedir {
namespace {

// The daemon waits 15 seconds for the daily upkeep of all services together.
constexpr std::uint64_t kVerifyNs = 4'000'000'000;

void logProblems(const char* operation, const std::vector<std::string>& problems) {
  for (const std::string& problem : problems) logProblem("%s %s", operation, problem);
}

}  // namespace

sdk::Answer CacheService::purgeable(const sdk::Job& job) {
  if (job.volume.empty() || job.urgency < 1 || job.urgency > kUrgencies) return {};
  const auto cancellation = job.cancellation;
  const Estimate estimate = cleaner_->estimate(
      job.volume, CancelToken([cancellation] { return cancellation.cancelled(); }));
  logProblems("servicePurgeable", estimate.problems);
  sdk::Answer answer;
  answer.amount = estimate.bytes[static_cast<std::size_t>(job.urgency - 1)];
  return answer;
}

sdk::Answer CacheService::purge(const sdk::Job& job) {
  return free("servicePurge", job, {.amount = job.amount, .urgency = job.urgency});
}

sdk::Answer CacheService::periodic(const sdk::Job& job) {
  FreeRequest request;
  request.periodic = true;
  sdk::Answer answer = free("servicePeriodic", job, request);
  if (job.volume.empty()) return answer;
  const auto cancellation = job.cancellation;
  logProblems("servicePeriodic",
              cleaner_->verifyIndex(job.volume, kVerifyNs, CancelToken([cancellation] {
                                      return cancellation.cancelled();
                                    })));
  return answer;
}

sdk::Answer CacheService::free(const char* operation, const sdk::Job& job, FreeRequest request) {
  // A request that names no volume asks for none: freeing somewhere else would help nobody.
  if (job.volume.empty()) return {};
  const auto cancellation = job.cancellation;
  request.volume = job.volume;
  request.cancelled = [cancellation] { return cancellation.cancelled(); };
  const FreeResult result = cleaner_->free(request);
  logProblems(operation, result.problems);
  logTrace("%s %s asked: %llu, urgency: %d, freed: %llu, files: %llu", operation, job.volume,
           request.amount, request.urgency, result.bytes, result.files);
  sdk::Answer answer;
  answer.amount = result.bytes;
  return answer;
}

}  // namespace spacekeep::cachedir
