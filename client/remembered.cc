// What the daemon has done, put down for the history and shown from it. Putting it down takes some
// microseconds and no disk, and comes before the answer, so that whoever has it finds the entry.
#include <utility>

#include "client/entitlements.h"
#include "daemon/spacekeep.h"
#include "history/entry.h"
#include "history/history.h"
#include "operations/info_keys.h"
#include "operations/periodic_operation.h"
#include "purge/purge_operation.h"
#include "support/access/peer_identity.h"
#include "support/logging/log.h"
#include "support/timebase.h"

namespace spacekeep {
namespace {

constexpr const char* kNoHistoryKept = "this daemon keeps no history";
constexpr double kNsPerSecond = 1'000'000'000.0;

/// The client whose call the running thread serves, none outside of a call.
std::optional<history::Asker> currentAsker() {
  const ipc::PeerConnection* connection = ipc::currentConnection();
  if (connection == nullptr) return std::nullopt;
  const access::PeerIdentity& identity = connection->identity();
  return history::Asker{.uid = identity.uid(),
                        .pid = identity.pid(),
                        .program = identity.program(),
                        .unit = identity.unit()};
}

}  // namespace

// Who asks on nobody's behalf is the handling of low space.
void Spacekeep::rememberPurge(const SpacekeepPurgeOperation& operation,
                              const Dictionary& outcome) const {
  if (!history_) return;
  history_->add(history::purgeEntry({.client = currentAsker(),
                                     .ended = {rt::wallClockNs()},
                                     .request = operation.info(),
                                     .outcome = outcome,
                                     .urgency_limit = operation.urgencyLimit(),
                                     .services = operation.services().size(),
                                     .reported_by_service = operation.reportedByService()}));
}

OperationCompletion Spacekeep::rememberingDailyPass(
    const std::shared_ptr<SpacekeepPeriodicOperation>& operation) const {
  if (!history_) return [](const Dictionary&) {};
  const Value* volume = operation->info().find(keys::kVolume);
  const std::uint64_t start_ticks = rt::ticks();
  const std::uint64_t begin_bytes = platform_.volumes.volumeFreespace(volume);
  return [this, operation = operation.get(), volume, start_ticks,
          begin_bytes](const Dictionary& outcome) {
    history_->add(history::dailyPassEntry(
        {.ended = {rt::wallClockNs()},
         .request = operation->info(),
         .outcome = outcome,
         .services = operation->services().size(),
         .in_flight = operation->copyInFlight(),
         .freespace_begin_bytes = begin_bytes,
         .freespace_end_bytes = platform_.volumes.volumeFreespace(volume),
         .elapsed_seconds = elapsedNs(start_ticks, rt::ticks()) / kNsPerSecond}));
  };
}

void Spacekeep::clientHistory(Dictionary info, HistoryReply reply, HistoryFailure failed) {
  if (!connectionIsEntitled(entitlements::kItemizedPurgeable)) {
    logProblem("%s Connection is not entitled!", "clientHistory");
    platform_.global.async([reply = std::move(reply)] { reply(std::nullopt); });
  } else if (!history_) {
    platform_.global.async([failed = std::move(failed)] { failed(kNoHistoryKept); });
  } else {
    history_->page(std::move(info), std::move(reply), std::move(failed));
  }
}

}  // namespace spacekeep
