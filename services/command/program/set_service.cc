#include "services/command/program/set_service.h"

#include "support/logging/log.h"

namespace spacekeep::command {
namespace {

void logProblems(const char* operation, const std::vector<std::string>& problems) {
  for (const std::string& problem : problems) logProblem("%s %s", operation, problem);
}

CancelToken tokenOf(const sdk::Job& job) {
  return CancelToken([cancellation = job.cancellation] { return cancellation.cancelled(); });
}

}  // namespace

sdk::Answer SetService::purgeable(const sdk::Job& job) {
  if (job.volume.empty() || job.urgency < 1 || job.urgency > kUrgencies) return {};
  const Offer offer = set_->offer(job.volume, tokenOf(job));
  logProblems("servicePurgeable", offer.problems);
  sdk::Answer answer;
  answer.amount = offer.bytes[static_cast<std::size_t>(job.urgency - 1)];
  return answer;
}

sdk::Answer SetService::purge(const sdk::Job& job) { return free("servicePurge", job, false); }

sdk::Answer SetService::periodic(const sdk::Job& job) { return free("servicePeriodic", job, true); }

sdk::Answer SetService::free(const char* operation, const sdk::Job& job, bool periodic) {
  // A request that names no volume asks for none: freeing somewhere else would help nobody.
  if (job.volume.empty()) return {};
  const Result result = set_->free(
      {.amount = job.amount, .urgency = job.urgency, .periodic = periodic, .volume = job.volume},
      tokenOf(job));
  logProblems(operation, result.problems);
  logTrace("%s %s asked: %llu, urgency: %d, freed: %llu", operation, job.volume, job.amount,
           job.urgency, result.bytes);
  sdk::Answer answer;
  answer.amount = result.bytes;
  return answer;
}

}  // namespace spacekeep::command
