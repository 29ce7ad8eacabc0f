#include "ctl/check_service/checks.h"

namespace spacekeep::ctl {

const std::vector<Check>& allChecks() {
  static const std::vector<Check> checks{
      {"ping", "answers servicePing", false, false, checkPing},
      {"query-frees-nothing", "only counts when it is asked what it could free", false, false,
       checkQueryFreesNothing},
      {"query-amounts", "says amounts that the volume can hold", false, false, checkQueryAmounts},
      {"query-urgencies", "offers no less at a higher urgency", false, false, checkQueryUrgencies},
      {"unknown-volume", "has nothing on a volume that it has no data on", false, false,
       checkUnknownVolume},
      {"other-members", "answers serviceNotify, serviceCallback and serviceCancelPurge", false,
       false, checkOtherMembers},
      {"back-to-back", "answers requests that arrive together", false, false, checkBackToBack},
      {"odd-requests", "survives requests that make no sense", false, false, checkOddRequests},
      {"upkeep", "holds no more descriptors and memory after 200 requests than before", false,
       false, checkUpkeep},
      {"purge-nothing", "frees nothing when it is asked for 0 bytes", true, false,
       checkPurgeOfNothing},
      {"purge-other-volume", "frees nothing for a volume that it has no data on", true, false,
       checkPurgeOfUnknownVolume},
      {"purge-share", "gives what it offered", true, false, checkPurgeOfShare},
      {"purge-limit", "gives no more than it was asked for and one item", true, false,
       checkPurgeLimit},
      {"cancel", "ends a purge soon after serviceCancelPurge, and still answers it", true, false,
       checkCancel},
      {"periodic", "answers servicePeriodic", true, false, checkPeriodic},
      {"daemon-gone", "survives the end of the daemon and is there for the next one", false, false,
       checkDaemonGone},
      {"purge-everything", "gives all it can when it is asked for more than it has", true, false,
       checkPurgeOfEverything},
      {"in-use", "leaves files alone that are in use", true, false, checkInUse},
      {"answers", "answers every request", false, true, checkAnswers},
      {"in-time", "answers before the daemon stops waiting", false, true, checkInTime},
      {"answers-once", "answers no request twice", false, true, checkAnswersOnce},
      {"answer-form", "answers with a number of bytes", false, true, checkAnswerForm},
      {"honest-amounts", "says what it has freed", true, true, checkHonestAmounts},
  };
  return checks;
}

}  // namespace spacekeep::ctl
