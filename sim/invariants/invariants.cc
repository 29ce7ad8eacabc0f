#include "sim/invariants/invariants.h"

#include <array>

namespace spacekeep::sim {
namespace {

constexpr std::array kInvariants = {
    Invariant{"the run ends and leaves nothing blocked", checkEnd, Holds::kInScenario},
    Invariant{"every line stands where it belongs", checkOddities},
    Invariant{"each client gets exactly one answer", checkOneAnswerPerClient, Holds::kInScenario},
    Invariant{"the answer is what the purge reported last", checkAnswersAreOutcomes,
              Holds::kInScenario},
    Invariant{"purges never overlap", checkPurgesDoNotOverlap},
    Invariant{"only purging services are asked", checkOnlyPurgingServicesAreAsked,
              Holds::kInScenario},
    Invariant{"only a purge that fell short cancels", checkCancelsFollowShortfalls},
    Invariant{"every urgency up to the limit runs", checkUrgencies},
    Invariant{"waits are exact", checkWaitsAreExact},
    Invariant{"only a reply ends a wait early", checkOnlySignalsEndWaits},
    Invariant{"the last reply of a purge that waits signals it", checkTheLastReplySignals},
    Invariant{"a share is an equal part of what is missing", checkSharesAreEqualParts},
    Invariant{"shares are computed one after another on their queue", checkSharesOneAfterAnother},
    Invariant{"every service is offered its first share before any its second",
              checkFirstSharesComeFirst},
    Invariant{"shares never add up to more than is missing", checkSharesDoNotExceedWhatIsMissing},
    Invariant{"nobody is asked for 0 bytes", checkNobodyIsAskedForNothing},
    Invariant{"the divisor is the number of services that can still give", checkDivisor},
    Invariant{"no service is asked twice at once", checkNeverAskedTwiceAtOnce},
    Invariant{"the in-flight set follows requests and their ends", checkInFlightSet},
    Invariant{"every request ends once", checkEveryRequestEndsOnce, Holds::kAtTheEnd},
    Invariant{"a met share is followed by another offer", checkMetSharesAreOfferedAnother,
              Holds::kAtTheEnd},
    Invariant{"the freed amount is what the volume gained", checkFreedIsMeasured},
    Invariant{"the reported amount is the sum of the replies", checkReportedSum},
    Invariant{"statistics of services balance with replies", checkServiceStatistics,
              Holds::kAtTheEnd},
    Invariant{"statistics of purges balance with outcomes", checkPurgeStatistics, Holds::kAtTheEnd},
    Invariant{"urgency records name what services reported", checkReportingServices},
};

void judgeBy(const Invariant& invariant, const PurgeStory& story,
             std::vector<Violation>& violations) {
  Findings findings;
  invariant.check(story, findings);
  for (std::string& text : findings) violations.push_back({invariant.name, std::move(text)});
}

}  // namespace

std::span<const Invariant> purgeInvariants() { return kInvariants; }

std::vector<Violation> judge(const PurgeRun& run) {
  const PurgeStory story(viewOf(run));
  std::vector<Violation> violations;
  for (const Invariant& invariant : kInvariants) {
    judgeBy(invariant, story, violations);
    if (invariant.check == checkEnd && !violations.empty()) break;
  }
  return violations;
}

void judgePurges(const PurgeStory& life, std::vector<Violation>& violations) {
  for (const Invariant& invariant : kInvariants) {
    if (invariant.holds == Holds::kInScenario) continue;
    if (invariant.holds == Holds::kAtTheEnd && life.run.cut) continue;
    judgeBy(invariant, life, violations);
  }
}

}  // namespace spacekeep::sim
