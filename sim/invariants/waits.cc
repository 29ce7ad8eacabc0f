// Invariants on urgencies and their waits, in virtual time.
#include <algorithm>
#include <cmath>

#include "sim/invariants/invariants.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
constexpr std::uint64_t kLongestTimeoutSeconds = 300;

std::int32_t expectedLimit(const Dictionary& request) {
  const Value* limit = request.find("SPACEKEEP_URGENCY");
  if (limit == nullptr) limit = request.find("SPACEKEEP_URGENCY_LIMIT");
  const auto level = limit == nullptr ? std::nullopt : limit->asSigned();
  return level && *level >= 1 && *level <= 4 ? static_cast<std::int32_t>(*level) : 3;
}

std::uint64_t expectedWaitSeconds(const Operation& operation, std::int32_t urgency) {
  const auto asked = unsignedAt(operation.request, "SPACEKEEP_PURGE_TIMEOUT").value_or(0);
  if (asked != 0) return std::min(asked, kLongestTimeoutSeconds);
  return 2 * static_cast<std::uint64_t>(urgency);
}

/// Whether a purge that asked for it may have found, within these bounds, that it has what it needs
/// and that nobody is at work for it.
bool mayHaveFinished(const PurgeStory& story, const Operation& operation, std::size_t first,
                     std::size_t last) {
  if (!story.mayFinishEarly(operation) || !story.hadReached(operation, first, last)) return false;
  const auto index = static_cast<std::size_t>(&operation - story.operations.data());
  return story.wasIdle(index, first, last, true);
}

bool isComplete(const Operation& operation) {
  return operation.end_at != kNowhere && operation.measured_at != kNowhere &&
         std::all_of(operation.passes.begin(), operation.passes.end(), [](const Pass& pass) {
           return pass.waiting_at != kNowhere && pass.stats_at != kNowhere;
         });
}

void checkWait(const PurgeStory& story, const Operation& operation, const Pass& pass,
               Findings& findings) {
  const std::string where =
      story.name(operation) + " at urgency " + std::to_string(pass.urgency) + " ";
  if (pass.wait_seconds != expectedWaitSeconds(operation, pass.urgency)) {
    findings.push_back(where + "announced a wait of " + std::to_string(pass.wait_seconds) +
                       " seconds");
  }
  const std::uint64_t waited = story.timeAt(pass.stats_at) - story.timeAt(pass.waiting_at);
  const std::uint64_t allowed = pass.wait_seconds * kNsPerSecond;
  const std::uint64_t most = allowed + story.writingNs(pass.waiting_at, pass.stats_at);
  if (waited > most || (pass.timed_out_at != kNowhere && waited < allowed)) {
    findings.push_back(where + "waited " + std::to_string(waited) + " ns of " +
                       std::to_string(allowed));
  }
}

std::uint64_t signalsBefore(const PurgeStory& story, const Operation& operation, std::size_t at) {
  std::uint64_t signals = 0;
  for (const Reply& reply : story.replies) {
    if (reply.operation == kNowhere || &story.operations[reply.operation] != &operation) continue;
    if (reply.removing_at < at) signals += reply.signals;
  }
  return signals;
}

}  // namespace

void checkUrgencies(const PurgeStory& story, Findings& findings) {
  for (const Operation& operation : story.operations) {
    if (operation.limit != expectedLimit(operation.request)) {
      findings.push_back(story.name(operation) + " ran with limit " +
                         std::to_string(operation.limit));
    }
    if (!isComplete(operation)) {
      if (story.run.cut) continue;
      findings.push_back(story.name(operation) + " did not come to its end");
      continue;
    }
    const auto limit = static_cast<std::size_t>(operation.limit);
    const std::size_t ran = operation.passes.size();
    if (ran == limit) continue;
    const std::size_t from = ran == 0 ? operation.begin_at : operation.passes.back().stats_at;
    if (ran < limit && mayHaveFinished(story, operation, from, operation.measured_at)) continue;
    findings.push_back(story.name(operation) + " ran " + std::to_string(ran) + " urgencies of " +
                       std::to_string(limit));
  }
}

void checkWaitsAreExact(const PurgeStory& story, Findings& findings) {
  for (const Operation& operation : story.operations) {
    if (!isComplete(operation)) continue;
    std::uint64_t waited = 0;
    for (const Pass& pass : operation.passes) {
      checkWait(story, operation, pass, findings);
      waited += story.timeAt(pass.stats_at) - story.timeAt(pass.waiting_at);
    }
    const std::uint64_t took = story.timeAt(operation.end_at) - story.timeAt(operation.begin_at);
    if (took < waited || took - waited > story.writingNs(operation.begin_at, operation.end_at)) {
      findings.push_back(story.name(operation) + " took " + std::to_string(took) +
                         " ns and waited " + std::to_string(waited));
    }
    const Value* told = operation.outcome.find("SPACEKEEP_ELAPSED_TIME");
    const double seconds = static_cast<double>(took) / 1e9;
    if (told == nullptr || std::abs(told->asDouble().value_or(-1) - seconds) > 1e-6) {
      findings.push_back(story.name(operation) + " told another time than the " +
                         std::to_string(seconds) + " s it took");
    }
  }
}

// A semaphore's signal ends one wait. Failed connections do not signal: when the last service in
// flight fails, the wait runs out.
void checkOnlySignalsEndWaits(const PurgeStory& story, Findings& findings) {
  for (const Operation& operation : story.operations) {
    if (!isComplete(operation)) continue;
    std::uint64_t early_ends = 0;
    for (const Pass& pass : operation.passes) {
      if (pass.timed_out_at != kNowhere) continue;
      const bool finished_early = story.mayFinishEarly(operation) &&
                                  story.hadReached(operation, pass.waiting_at, pass.stats_at);
      if (finished_early) continue;
      ++early_ends;
      if (early_ends <= signalsBefore(story, operation, pass.stats_at)) continue;
      findings.push_back(story.name(operation) + " stopped waiting at urgency " +
                         std::to_string(pass.urgency) + " without a signal");
    }
  }
  for (const Reply& reply : story.replies) {
    if (reply.signals > 0 && reply.operation != kNowhere &&
        !story.wasIdle(reply.operation, reply.removing_at, reply.signalled_at, false)) {
      findings.push_back("a reply of " + reply.service +
                         " signalled while services were still in flight");
    }
    if (reply.signals <= 1) continue;
    findings.push_back("one reply of " + reply.service + " signalled " +
                       std::to_string(reply.signals) + " times");
  }
}

// Whoever leaves flight last, while the purge has a semaphore, signals it; after its end nobody does.
void checkTheLastReplySignals(const PurgeStory& story, Findings& findings) {
  for (const Reply& reply : story.replies) {
    if (reply.operation == kNowhere || reply.done_at == kNowhere) continue;
    const Operation& operation = story.operations[reply.operation];
    if (operation.passes.empty()) continue;
    const bool is_last = story.staysIdle(reply.operation, reply.removing_at, reply.done_at);
    const bool is_during = reply.removing_at > operation.passes.front().begin_at &&
                           reply.done_at < operation.measured_at;
    if (is_last && is_during && reply.signals == 0) {
      findings.push_back("the reply of " + reply.service + " was the last and did not signal");
    }
    if (reply.signals > 0 && operation.end_at < reply.removing_at) {
      findings.push_back("a reply of " + reply.service + " signalled after the end of its purge");
    }
  }
}

}  // namespace spacekeep::sim
