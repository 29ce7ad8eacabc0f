#include "sim/invariants/system/system_invariants.h"

#include <algorithm>
#include <array>

namespace spacekeep::sim {
namespace {

constexpr bool kNeedsTheEnd = true;

constexpr std::array kInvariants = {
    SystemInvariant{"every call ends as it must, once", checkCallsEndAsTheyMust},
    SystemInvariant{"an answer is the outcome of its own request", checkAnswersSayWhatHappened},
    SystemInvariant{"a refused request does nothing", checkRefusedCallsDoNothing, kNeedsTheEnd},
    SystemInvariant{"no client cancels a purge", checkNothingIsCancelled},
    SystemInvariant{"purges begin in the order of their requests", checkPurgesBeginInOrder},
    SystemInvariant{"an operation waits for those before it in its own queue only",
                    checkOperationsWaitForTheirQueueOnly},
    SystemInvariant{"queries never overlap", checkQueriesDoNotOverlap},
    SystemInvariant{"state calls and cancels do not wait for operations", checkSmallCallsDoNotWait},
    SystemInvariant{"a query waits as long as its urgency allows", checkQueryWaits},
    SystemInvariant{"a query's result is the sum of what is remembered", checkQueryResults},
    SystemInvariant{"a query asks whom the record does not know, and nobody else",
                    checkWhomQueriesAsk},
    SystemInvariant{"a query asks each service once, with its own request", checkQueryRequests},
    SystemInvariant{"every answer to a query is remembered", checkAnswersAreRemembered,
                    kNeedsTheEnd},
    SystemInvariant{"the record holds what was answered lately, and nothing else",
                    checkRecordOfAnswers},
    SystemInvariant{"a read sees the last write that was answered", checkReadsSeeWrites},
    SystemInvariant{"what is answered as stored is on the disk", checkStoredIsOnDisk},
    SystemInvariant{"a life begins with what was stored in the one before",
                    checkLifeBeginsWithWhatWasStored},
    SystemInvariant{"a stored setting is told to those who want to know", checkNotifications,
                    kNeedsTheEnd},
    SystemInvariant{"nothing but services that purge is asked to purge",
                    checkOnlyServicesThatPurgeArePurged},
    SystemInvariant{"a purge works on the registry of its request", checkSnapshotIsOfTheRequest},
    SystemInvariant{"a service is pinged once, as it is registered", checkPings, kNeedsTheEnd},
    SystemInvariant{"low space purges 250 MiB on each low volume", checkLowSpace},
    SystemInvariant{"low-space events are counted by their flag", checkLowSpaceStatistics,
                    kNeedsTheEnd},
    SystemInvariant{"a periodic pass asks each service once and ends within 15 s",
                    checkPeriodicPasses},
    SystemInvariant{"periodic work is asked for at urgency 3 of those who purge",
                    checkPeriodicRequests},
    SystemInvariant{"keep-alive transactions balance", checkKeepAlive},
    SystemInvariant{"what is asked and held stays bounded", checkBounds},
    SystemInvariant{"log lines have their formats and levels", checkLogFormats},
    SystemInvariant{"statistics have their domain and names", checkStatisticNames},
};

const char* wordFor(SystemEnd end) {
  switch (end) {
    case SystemEnd::kFinished:
      return "finished";
    case SystemEnd::kSilentPing:
      return "deadlock: silent ping";
    case SystemEnd::kDeadlock:
      return "deadlock";
    case SystemEnd::kStuck:
      return "stuck";
  }
  return "?";
}

std::string joined(const std::vector<std::string>& texts) {
  std::string all;
  for (const std::string& text : texts) all += (all.empty() ? "" : "; ") + text;
  return all;
}

bool hasOpenPing(const Life& life) {
  return std::any_of(life.pings.begin(), life.pings.end(),
                     [](const PingWait& wait) { return wait.to == kNowhere; });
}

/// Whether each life that stood still did so on a ping. A daemon that does is killed like any other,
/// and the next one may find all services willing.
bool stoodStillOnPings(const SystemStory& story) {
  return std::all_of(story.lives.begin(), story.lives.end(), [](const Life& life) {
    return life.facts->end == SystemEnd::kFinished ||
           (life.facts->end == SystemEnd::kSilentPing && hasOpenPing(life));
  });
}

/// The one deadlock that there may be is the known one: a service that is silent to its ping.
std::vector<Violation> judgeEnd(const SystemStory& story) {
  const SystemRun& run = story.run;
  const bool finished = run.end == SystemEnd::kFinished && run.blocked.empty();
  const bool silent_ping = run.end == SystemEnd::kSilentPing &&
                           run.plan.faults.contains(Fault::kSilentPing) && stoodStillOnPings(story);
  if (finished || silent_ping) return {};
  return {{"the run ends, or stands still on a silent ping",
           std::string(wordFor(run.end)) + ": " + joined(run.blocked)}};
}

}  // namespace

std::span<const SystemInvariant> systemInvariants() { return kInvariants; }

std::vector<Violation> judge(const SystemRun& run) {
  const SystemStory story(run);
  std::vector<Violation> violations = judgeEnd(story);
  if (!violations.empty()) return violations;
  for (const std::string& oddity : story.oddities) {
    violations.push_back({"every line stands where it belongs", oddity});
  }
  for (const Life& life : story.lives) {
    for (const SystemInvariant& invariant : kInvariants) {
      if (invariant.needs_the_end && life.cut) continue;
      Findings findings;
      invariant.check(story, life, findings);
      for (std::string& text : findings) {
        violations.push_back({invariant.name, "life " + std::to_string(life.number) + ": " + text});
      }
    }
    judgePurges(*life.purges, violations);
  }
  return violations;
}

}  // namespace spacekeep::sim
