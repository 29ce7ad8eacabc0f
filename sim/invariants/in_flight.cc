// Invariants on requests to services and on the in-flight set.
#include <algorithm>
#include <utility>

#include "sim/invariants/invariants.h"

namespace spacekeep::sim {
namespace {

using Request = std::pair<std::string, std::size_t>;  // service and purge

/// Purge calls that a service has received and neither answered nor seen fail.
std::map<std::string, std::int64_t> openCalls(const PurgeStory& story) {
  std::map<std::string, std::int64_t> open;
  for (const Event& event : story.run.events) {
    if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
      if (asked->member == "servicePurge") ++open[asked->service];
    } else if (const auto* answered = std::get_if<ServiceAnswered>(&event.body)) {
      if (answered->member == "servicePurge") --open[answered->service];
    } else if (const auto* failed = std::get_if<ServiceCallFailed>(&event.body)) {
      if (failed->member == "servicePurge") --open[failed->service];
    }
  }
  return open;
}

}  // namespace

void checkNeverAskedTwiceAtOnce(const PurgeStory& story, Findings& findings) {
  std::map<Request, std::int64_t> open;
  for (const Event& event : story.run.events) {
    if (const auto* asked = std::get_if<ServiceAsked>(&event.body)) {
      if (asked->member != "servicePurge") continue;
      const std::size_t operation = story.operationOfCall(asked->call);
      if (++open[{asked->service, operation}] > 1) {
        findings.push_back(asked->service + " was asked again before it had answered");
      }
    } else if (const auto* answered = std::get_if<ServiceAnswered>(&event.body)) {
      if (answered->member == "servicePurge") {
        --open[{answered->service, story.operationOfCall(answered->call)}];
      }
    } else if (const auto* failed = std::get_if<ServiceCallFailed>(&event.body)) {
      if (failed->member == "servicePurge")
        --open[{failed->service, story.operationOfCall(failed->call)}];
    }
  }
  for (const auto& [service, times] : story.run.asked_twice) {
    if (times != 0) findings.push_back(service + " saw a second request at once");
  }
}

// An addition succeeds exactly when the service is not in flight.
void checkInFlightSet(const PurgeStory& story, Findings& findings) {
  for (const ShareTask& task : story.tasks) {
    if (task.operation == kNowhere || task.adding_at == kNowhere) continue;
    const Operation& operation = story.operations[task.operation];
    const int before = story.inFlightBefore(task.operation, task.service, task.adding_at);
    if ((before == 0) == task.added) continue;
    findings.push_back(story.name(operation) + (task.added ? " added " : " refused ") +
                       task.service + " with " + std::to_string(before) +
                       " requests of it in flight");
  }
}

void checkEveryRequestEndsOnce(const PurgeStory& story, Findings& findings) {
  std::map<std::string, std::int64_t> unfinished;
  for (const ShareTask& task : story.tasks) {
    if (task.added && task.share && task.share->donation > 0) ++unfinished[task.service];
  }
  for (const Reply& reply : story.replies) {
    --unfinished[reply.service];
    if (reply.removals != 1) {
      findings.push_back("a reply of " + reply.service + " removed it " +
                         std::to_string(reply.removals) + " times from the in-flight set");
    }
    if (reply.done_at == kNowhere) {
      findings.push_back("a reply of " + reply.service + " was not booked to its end");
    }
  }
  for (const Failure& failure : story.failures) {
    --unfinished[failure.service];
    if (failure.removing_at == kNowhere) {
      findings.push_back("a failed service stayed in the in-flight set");
    }
  }
  const auto open = openCalls(story);
  for (const auto& [service, count] : unfinished) {
    const auto calls = open.find(service);
    const std::int64_t expected = calls == open.end() ? 0 : calls->second;
    if (count == expected) continue;
    findings.push_back(service + " has " + std::to_string(count) + " requests without an end, " +
                       std::to_string(expected) + " are still with it");
  }
}

void checkMetSharesAreOfferedAnother(const PurgeStory& story, Findings& findings) {
  for (std::size_t index = 0; index < story.operations.size(); ++index) {
    const Operation& operation = story.operations[index];
    const auto asked = std::count_if(operation.passes.begin(), operation.passes.end(),
                                     [](const Pass& pass) { return pass.asked_at != kNowhere; });
    for (const std::string& service : operation.services) {
      const auto met =
          std::count_if(story.replies.begin(), story.replies.end(), [&](const Reply& reply) {
            return reply.operation == index && reply.service == service && metItsShare(reply);
          });
      const auto offered =
          std::count_if(story.tasks.begin(), story.tasks.end(), [&](const ShareTask& task) {
            return task.operation == index && task.service == service;
          });
      if (offered == asked + met) continue;
      findings.push_back(story.name(operation) + " made " + service + " " +
                         std::to_string(offered) + " offers in " + std::to_string(asked) +
                         " urgencies, in which it met " + std::to_string(met) + " shares");
    }
  }
}

}  // namespace spacekeep::sim
