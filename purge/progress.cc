#include "purge/decisions.h"
#include "purge/purge_operation.h"
#include "support/logging/log.h"

namespace spacekeep {

void SpacekeepPurgeOperation::reportPercentageForAmountRequested(
    std::uint64_t requested_bytes, std::uint64_t purged_bytes,
    const std::string& identifier) const {
  Statistics& statistics = platform().statistics;
  if (requested_bytes != 0) {
    const std::int32_t bucket = purge::percentBucket(requested_bytes, purged_bytes);
    const std::string name = identifier + ".purged." + std::to_string(bucket) + ".percent";
    statistics.addReportStat(kStatisticsDomain, name, 1);
    logTrace("%s %@", "reportPercentageForAmountRequested", name);
  }
  statistics.addReportStat(kStatisticsDomain, identifier + ".purged",
                           static_cast<std::int64_t>(purged_bytes));
  logTrace("%s %@ donated %lld of %lld", "reportPercentageForAmountRequested", identifier,
           purged_bytes, requested_bytes);
}

}  // namespace spacekeep
