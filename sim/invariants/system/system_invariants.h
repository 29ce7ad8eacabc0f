// Thread safety: pure functions.
//
// What must hold in every run of the whole daemon, whatever the schedule. Each invariant looks at
// the story of a run and says in words what it found wrong; nothing said means that it holds. Those
// on single purges are in ../invariants.h and are judged life by life.
#pragma once

#include <span>
#include <string>
#include <vector>

#include "sim/invariants/invariants.h"
#include "sim/invariants/system/system_story.h"

namespace spacekeep::sim {

struct SystemInvariant {
  const char* name;
  void (*check)(const SystemStory& story, const Life& life, Findings& findings);
  /// Only in lives that are not cut: it compares what was begun with what came of it.
  bool needs_the_end = false;
};

[[nodiscard]] std::span<const SystemInvariant> systemInvariants();

/// Judges a run. A run that did not come to its end is not looked at any further.
[[nodiscard]] std::vector<Violation> judge(const SystemRun& run);

// Calls of clients.
void checkCallsEndAsTheyMust(const SystemStory& story, const Life& life, Findings& findings);
void checkAnswersSayWhatHappened(const SystemStory& story, const Life& life, Findings& findings);
void checkRefusedCallsDoNothing(const SystemStory& story, const Life& life, Findings& findings);
void checkNothingIsCancelled(const SystemStory& story, const Life& life, Findings& findings);

// Queues.
void checkPurgesBeginInOrder(const SystemStory& story, const Life& life, Findings& findings);
void checkOperationsWaitForTheirQueueOnly(const SystemStory& story, const Life& life,
                                          Findings& findings);
void checkQueriesDoNotOverlap(const SystemStory& story, const Life& life, Findings& findings);
void checkSmallCallsDoNotWait(const SystemStory& story, const Life& life, Findings& findings);

// Queries.
void checkQueryWaits(const SystemStory& story, const Life& life, Findings& findings);
void checkQueryResults(const SystemStory& story, const Life& life, Findings& findings);
void checkWhomQueriesAsk(const SystemStory& story, const Life& life, Findings& findings);
void checkQueryRequests(const SystemStory& story, const Life& life, Findings& findings);
void checkAnswersAreRemembered(const SystemStory& story, const Life& life, Findings& findings);
void checkRecordOfAnswers(const SystemStory& story, const Life& life, Findings& findings);

// Client state.
void checkReadsSeeWrites(const SystemStory& story, const Life& life, Findings& findings);
void checkStoredIsOnDisk(const SystemStory& story, const Life& life, Findings& findings);
void checkLifeBeginsWithWhatWasStored(const SystemStory& story, const Life& life,
                                      Findings& findings);
void checkNotifications(const SystemStory& story, const Life& life, Findings& findings);

// Services.
void checkOnlyServicesThatPurgeArePurged(const SystemStory& story, const Life& life,
                                         Findings& findings);
void checkSnapshotIsOfTheRequest(const SystemStory& story, const Life& life, Findings& findings);
void checkPings(const SystemStory& story, const Life& life, Findings& findings);

// Events.
void checkLowSpace(const SystemStory& story, const Life& life, Findings& findings);
void checkLowSpaceStatistics(const SystemStory& story, const Life& life, Findings& findings);
void checkPeriodicPasses(const SystemStory& story, const Life& life, Findings& findings);
void checkPeriodicRequests(const SystemStory& story, const Life& life, Findings& findings);
void checkKeepAlive(const SystemStory& story, const Life& life, Findings& findings);

// Bounds and what is told.
void checkBounds(const SystemStory& story, const Life& life, Findings& findings);
void checkLogFormats(const SystemStory& story, const Life& life, Findings& findings);
void checkStatisticNames(const SystemStory& story, const Life& life, Findings& findings);

}  // namespace spacekeep::sim
