#include "daemon/spacekeep.h"
#include "support/logging/log.h"

namespace spacekeep {

void Spacekeep::handleVFSStreamEvent(const Dictionary& event) {
  logProblem("%s low-disk events are not supported yet: %@", "handleVFSStreamEvent", event);
}

}  // namespace spacekeep
