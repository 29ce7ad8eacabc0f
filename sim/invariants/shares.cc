// Invariants on shares: how large they are, in which order they are computed, and where.
#include <algorithm>

#include "sim/invariants/invariants.h"

namespace spacekeep::sim {
namespace {

std::vector<const ShareTask*> tasksOf(const PurgeStory& story, std::size_t operation) {
  std::vector<const ShareTask*> tasks;
  for (const ShareTask& task : story.tasks) {
    if (task.operation == operation) tasks.push_back(&task);
  }
  return tasks;
}

/// Offers to the service that were queued before `at` and have not been computed by then.
std::int64_t outstandingOffers(const PurgeStory& story, std::size_t operation,
                               const std::string& service, std::size_t at) {
  std::int64_t offers = 0;
  for (const Pass& pass : story.operations[operation].passes) {
    if (pass.asked_at < at) ++offers;
  }
  for (const Reply& reply : story.replies) {
    if (reply.operation == operation && reply.service == service && reply.booked_at < at &&
        metItsShare(reply)) {
      ++offers;
    }
  }
  for (const ShareTask* task : tasksOf(story, operation)) {
    if (task->service == service && task->at < at) --offers;
  }
  return offers;
}

// Only a service that has nothing left over from before tells its first share from its second. A
// share that is being computed as the urgency begins may be met, and offered again, at any time.
bool isClean(const PurgeStory& story, std::size_t operation, const std::string& service,
             std::size_t at) {
  for (const ShareTask* task : tasksOf(story, operation)) {
    if (task->service == service && task->at < at && task->last_at > at) return false;
  }
  return outstandingOffers(story, operation, service, at) == 0 &&
         story.inFlightBefore(operation, service, at) == 0;
}

std::size_t endOfPass(const Operation& operation, std::size_t index) {
  for (std::size_t next = index + 1; next < operation.passes.size(); ++next) {
    if (operation.passes[next].asked_at != kNowhere) return operation.passes[next].asked_at;
  }
  return kNowhere;
}

/// Positions of each service's computations within a pass.
std::map<std::string, std::vector<std::size_t>> offersWithin(const PurgeStory& story,
                                                             std::size_t operation,
                                                             std::size_t first, std::size_t last) {
  std::map<std::string, std::vector<std::size_t>> offers;
  for (const ShareTask* task : tasksOf(story, operation)) {
    if (task->at > first && task->at < last) offers[task->service].push_back(task->at);
  }
  return offers;
}

void checkOrder(const PurgeStory& story, std::size_t index, std::size_t pass_index,
                Findings& findings) {
  const Operation& operation = story.operations[index];
  const Pass& pass = operation.passes[pass_index];
  const auto offers = offersWithin(story, index, pass.asked_at, endOfPass(operation, pass_index));
  std::size_t latest_first = 0;
  for (const auto& [service, at] : offers) {
    if (!isClean(story, index, service, pass.asked_at)) continue;
    if (at.front() < latest_first) {
      findings.push_back(story.name(operation) + " offered " + service +
                         " its share out of order at urgency " + std::to_string(pass.urgency));
    }
    latest_first = std::max(latest_first, at.front());
    if (at.size() < 2) continue;
    for (const std::string& other : operation.services) {
      const auto first = offers.find(other);
      if (first != offers.end() && first->second.front() < at[1]) continue;
      findings.push_back(story.name(operation) + " offered " + service +
                         " a second share at urgency " + std::to_string(pass.urgency) + " before " +
                         other + " its first");
    }
  }
}

/// Whether anything changes what is missing, or the services at work, from `first` to `last`.
bool isCalm(const PurgeStory& story, std::size_t first, std::size_t last) {
  const auto within = [&](std::size_t at) { return at >= first && at <= last; };
  for (const Reply& reply : story.replies) {
    if (within(reply.booked_at) || within(reply.removing_at)) return false;
  }
  for (const Failure& failure : story.failures) {
    if (within(failure.at) || within(failure.removing_at)) return false;
  }
  for (std::size_t at = first; at <= last; ++at) {
    if (std::holds_alternative<FreeSpaceIs>(story.run.events[at].body)) return false;
  }
  return true;
}

void checkSum(const PurgeStory& story, std::size_t index, std::size_t pass_index,
              Findings& findings) {
  const Operation& operation = story.operations[index];
  const Pass& pass = operation.passes[pass_index];
  // The divisor dates from the end of the wait before.
  std::size_t since = operation.begin_at;
  if (pass_index > 0) {
    const Pass& before = operation.passes[pass_index - 1];
    if (before.timed_out_at == kNowhere) return;
    since = before.timed_out_at;
  }
  std::uint64_t sum = 0;
  for (const ShareTask* task : tasksOf(story, index)) {
    if (task->at < pass.asked_at || !task->share) continue;
    if (!isCalm(story, since, task->last_at)) return;
    if (!task->added) continue;
    sum += task->share->donation;
    const std::uint64_t missing = task->share->needed - task->share->purged;
    if (sum <= missing) continue;
    findings.push_back(story.name(operation) + " asked for " + std::to_string(sum) +
                       " bytes at once with " + std::to_string(missing) + " missing");
    return;
  }
}

/// From here on the purge may set its divisor anew.
std::size_t firstWake(const PurgeStory& story, std::size_t index) {
  const Operation& operation = story.operations[index];
  if (operation.passes.empty()) return operation.begin_at;
  std::size_t first =
      std::min(operation.passes.front().timed_out_at, operation.passes.front().stats_at);
  for (const Reply& reply : story.replies) {
    if (reply.operation == index && reply.signals > 0) first = std::min(first, reply.removing_at);
  }
  if (story.mayFinishEarly(operation) && story.hadReached(operation, operation.begin_at, first)) {
    return operation.begin_at;
  }
  return first;
}

/// From here on the purge may set its divisor for the urgency that follows the pass: it wakes before
/// it tells of it. A signal counts from the end of the pass before on, since the semaphore is there
/// a moment before the urgency says that it begins.
std::size_t earliestWake(const PurgeStory& story, std::size_t index, std::size_t pass_index) {
  const Operation& operation = story.operations[index];
  const Pass& pass = operation.passes[pass_index];
  const std::size_t since = operation.passes[pass_index - 1].stats_at;
  std::size_t earliest = std::min(pass.timed_out_at, pass.stats_at);
  for (const Reply& reply : story.replies) {
    if (reply.operation != index || reply.signals == 0 || reply.signalled_at < since) continue;
    earliest = std::min(earliest, reply.signalled_at);
  }
  if (story.mayFinishEarly(operation) && story.hadReached(operation, since, earliest)) return since;
  return earliest;
}

/// Replies that fell short between two positions: those that surely and those that possibly did.
std::pair<std::uint64_t, std::uint64_t> shortRepliesWithin(const PurgeStory& story,
                                                           std::size_t operation,
                                                           std::size_t first_possible,
                                                           std::size_t first_sure,
                                                           const ShareTask& task) {
  std::uint64_t surely = 0;
  std::uint64_t possibly = 0;
  for (const Reply& reply : story.replies) {
    if (reply.operation != operation || metItsShare(reply)) continue;
    if (reply.booked_at > first_sure && reply.completion_at < task.at) ++surely;
    if (reply.completion_at > first_possible && reply.booked_at < task.share->at) ++possibly;
  }
  return {surely, possibly};
}

// From the second urgency on the divisor starts as the number of services that are not in flight at
// the end of the wait before.
void checkLaterDivisors(const PurgeStory& story, std::size_t index, std::size_t pass_index,
                        Findings& findings) {
  const Operation& operation = story.operations[index];
  const Pass& pass = operation.passes[pass_index];
  const Pass& before = operation.passes[pass_index - 1];
  const std::size_t waited_at =
      before.timed_out_at == kNowhere ? before.waiting_at : before.timed_out_at;
  const std::size_t end = earliestWake(story, index, pass_index);
  const auto [fewest, most] = story.inFlightBetween(index, waited_at, before.stats_at);
  const auto services = static_cast<std::int64_t>(operation.services.size());
  for (const ShareTask* task : tasksOf(story, index)) {
    if (!task->share || task->at < pass.asked_at || task->share->at > end) continue;
    const auto [surely, possibly] =
        shortRepliesWithin(story, index, waited_at, before.stats_at, *task);
    const std::int64_t least = services - most - static_cast<std::int64_t>(possibly);
    const std::int64_t largest = services - fewest - static_cast<std::int64_t>(surely);
    const auto divisor = static_cast<std::int64_t>(task->share->divisor);
    if (least <= 0 || (divisor >= least && divisor <= largest)) continue;
    findings.push_back("the divisor of " + task->service + " was " + std::to_string(divisor) +
                       " at urgency " + std::to_string(pass.urgency) + ", with " +
                       std::to_string(least) + " to " + std::to_string(largest) +
                       " services that can still give");
  }
}

}  // namespace

void checkSharesAreEqualParts(const PurgeStory& story, Findings& findings) {
  for (const ShareTask& task : story.tasks) {
    if (!task.share) continue;
    const Share& share = *task.share;
    if (share.divisor == 0 || share.purged >= share.needed ||
        share.donation != (share.needed - share.purged) / share.divisor) {
      findings.push_back("the share of " + task.service + " was " + std::to_string(share.donation) +
                         " of " + std::to_string(share.needed) + " less " +
                         std::to_string(share.purged) + " by " + std::to_string(share.divisor));
    }
    if (task.operation == kNowhere) continue;
    const Operation& operation = story.operations[task.operation];
    if (!story.hadFreed(operation, share.purged, task.at, share.at)) {
      findings.push_back("the share of " + task.service + " rests on " +
                         std::to_string(share.purged) + " freed bytes, which is out of date");
    }
  }
}

void checkSharesOneAfterAnother(const PurgeStory& story, Findings& findings) {
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    const ShareTask* previous = nullptr;
    for (const ShareTask* task : tasksOf(story, index)) {
      if (previous != nullptr && task->at < previous->last_at) {
        findings.push_back("the shares of " + previous->service + " and " + task->service +
                           " were computed at the same time");
      }
      if (task->thread == operation.thread && task->at < operation.end_at) {
        findings.push_back("the share of " + task->service +
                           " was computed by the thread that runs the purge");
      }
      previous = task;
    }
  }
  for (const Reply& reply : story.replies) {
    for (const ShareTask& task : story.tasks) {
      if (task.thread == reply.thread && task.at > reply.booked_at && task.at < reply.done_at) {
        findings.push_back("a share of " + task.service + " was computed inside of a reply");
      }
    }
  }
}

void checkFirstSharesComeFirst(const PurgeStory& story, Findings& findings) {
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    for (std::size_t pass = 0; pass < operation.passes.size(); ++pass) {
      if (operation.passes[pass].asked_at != kNowhere) checkOrder(story, index, pass, findings);
    }
  }
}

void checkSharesDoNotExceedWhatIsMissing(const PurgeStory& story, Findings& findings) {
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    for (std::size_t pass = 0; pass < operation.passes.size(); ++pass) {
      if (operation.passes[pass].asked_at != kNowhere) checkSum(story, index, pass, findings);
    }
  }
}

void checkNobodyIsAskedForNothing(const PurgeStory& story, Findings& findings) {
  for (const Event& event : story.run.events) {
    const auto* asked = std::get_if<ServiceAsked>(&event.body);
    if (asked == nullptr || asked->member != "servicePurge") continue;
    if (asked->amount.value_or(0) == 0) findings.push_back(asked->service + " was asked for 0");
  }
}

// In the first urgency it starts as the number of services and goes down by one with each reply
// that fell short. A reply in the middle of being booked may or may not have counted yet.
void checkDivisor(const PurgeStory& story, Findings& findings) {
  for (const ShareTask& task : story.tasks) {
    if (!task.share || task.operation == kNowhere) continue;
    const Operation& operation = story.operations[task.operation];
    // Of a purge that was cut short not every service has been seen.
    if (!story.namedAllServices(operation)) continue;
    if (task.share->at > firstWake(story, task.operation)) continue;
    std::uint64_t surely = 0;
    std::uint64_t possibly = 0;
    for (const Reply& reply : story.replies) {
      if (reply.operation != task.operation || metItsShare(reply)) continue;
      if (reply.completion_at < task.at) ++surely;
      if (reply.booked_at < task.share->at) ++possibly;
    }
    const std::uint64_t services = operation.services.size();
    const std::uint64_t divisor = task.share->divisor;
    const bool may_have_reached_0 = divisor == 1 && services <= possibly;
    if (may_have_reached_0) continue;
    if (divisor + surely <= services && divisor + possibly >= services) continue;
    findings.push_back("the divisor of " + task.service + " was " + std::to_string(divisor) +
                       " with " + std::to_string(services) + " services, of which " +
                       std::to_string(surely) + " to " + std::to_string(possibly) +
                       " had fallen short");
  }
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    if (!story.namedAllServices(operation)) continue;
    for (std::size_t pass = 1; pass < operation.passes.size(); ++pass) {
      if (operation.passes[pass].asked_at != kNowhere) {
        checkLaterDivisors(story, index, pass, findings);
      }
    }
  }
}

}  // namespace spacekeep::sim
