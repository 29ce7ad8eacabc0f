// Thread safety: pure functions.
//
// What must hold of purges in every run, whatever the schedule. Each invariant looks at the story of a
// run and says in words what it found wrong; nothing said means that it holds.
#pragma once

#include <span>
#include <string>
#include <vector>

#include "sim/invariants/purge_story.h"

namespace spacekeep::sim {

using Findings = std::vector<std::string>;

/// Where an invariant on purges holds.
enum class Holds {
  kAlways,
  kAtTheEnd,    ///< in runs that are not cut: it compares what was begun with what came of it
  kInScenario,  ///< it compares with the plan of a purge scenario
};

struct Invariant {
  const char* name;
  void (*check)(const PurgeStory& story, Findings& findings);
  Holds holds = Holds::kAlways;
};

[[nodiscard]] std::span<const Invariant> purgeInvariants();

struct Violation {
  std::string invariant;
  std::string text;
};

/// Judges a run. A run that did not come to its end is not looked at any further.
[[nodiscard]] std::vector<Violation> judge(const PurgeRun& run);
/// Judges the purges of a life of the whole daemon by what can be said of them without a scenario.
void judgePurges(const PurgeStory& life, std::vector<Violation>& violations);

// The course of a run.
void checkEnd(const PurgeStory& story, Findings& findings);
void checkOddities(const PurgeStory& story, Findings& findings);
void checkOneAnswerPerClient(const PurgeStory& story, Findings& findings);
void checkAnswersAreOutcomes(const PurgeStory& story, Findings& findings);
void checkPurgesDoNotOverlap(const PurgeStory& story, Findings& findings);
void checkOnlyPurgingServicesAreAsked(const PurgeStory& story, Findings& findings);
void checkCancelsFollowShortfalls(const PurgeStory& story, Findings& findings);

// Waits.
void checkUrgencies(const PurgeStory& story, Findings& findings);
void checkWaitsAreExact(const PurgeStory& story, Findings& findings);
void checkOnlySignalsEndWaits(const PurgeStory& story, Findings& findings);
void checkTheLastReplySignals(const PurgeStory& story, Findings& findings);

// Shares.
void checkSharesAreEqualParts(const PurgeStory& story, Findings& findings);
void checkSharesOneAfterAnother(const PurgeStory& story, Findings& findings);
void checkFirstSharesComeFirst(const PurgeStory& story, Findings& findings);
void checkSharesDoNotExceedWhatIsMissing(const PurgeStory& story, Findings& findings);
void checkNobodyIsAskedForNothing(const PurgeStory& story, Findings& findings);
void checkDivisor(const PurgeStory& story, Findings& findings);

// The in-flight set.
void checkNeverAskedTwiceAtOnce(const PurgeStory& story, Findings& findings);
void checkInFlightSet(const PurgeStory& story, Findings& findings);
void checkEveryRequestEndsOnce(const PurgeStory& story, Findings& findings);
void checkMetSharesAreOfferedAnother(const PurgeStory& story, Findings& findings);

// Amounts and statistics.
void checkFreedIsMeasured(const PurgeStory& story, Findings& findings);
void checkReportedSum(const PurgeStory& story, Findings& findings);
void checkServiceStatistics(const PurgeStory& story, Findings& findings);
void checkPurgeStatistics(const PurgeStory& story, Findings& findings);
void checkReportingServices(const PurgeStory& story, Findings& findings);

}  // namespace spacekeep::sim
