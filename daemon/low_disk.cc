// What the daemon does when the file system reports that space is low.
#include "daemon/low_disk.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/events/events.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

/// Logs the event. None for an event without a known flag, which is handled all the same.
std::optional<std::string_view> statisticOf(std::uint64_t flags) {
  if ((flags & kVqLowDisk) != 0) {
    logProblem("%s caught VQ_LOWDISK", "handleVFSStreamEvent");
    return "SK_LOWDISK_EVENT";
  }
  if ((flags & kVqVeryLowDisk) != 0) {
    logProblem("%s caught VQ_VERYLOWDISK", "handleVFSStreamEvent");
    return "SK_VERYLOWDISK_EVENT";
  }
  return std::nullopt;
}

Dictionary lowDiskRequest(const std::string& volume) {
  return {{keys::kVolume, volume},
          {keys::kAmount, kLowDiskAmountBytes},
          {keys::kAsync, true},
          {keys::kPurgeTimeout, kLowDiskTimeoutSeconds}};
}

}  // namespace

// Returns after the last purge, so the event's keep-alive transaction covers all of them.
void Spacekeep::handleVFSStreamEvent(const Dictionary& event) {
  const std::uint64_t flags = unsignedAt(event, kEventFlagsKey).value_or(0);
  const std::vector<std::string> volumes = platform_.volumes.lowSpaceVolumes();
  if (volumes.empty()) {
    logTrace("%s No volumes report low disk space, skipping purge", "handleVFSStreamEvent");
    return;
  }
  const std::optional<std::string_view> statistic = statisticOf(flags);
  for (const std::string& volume : volumes) {
    static_cast<void>(purge(lowDiskRequest(volume), nullptr));
  }
  platform_.statistics.addReportStat(kStatisticsDomain, statistic, 1);
}

}  // namespace spacekeep
