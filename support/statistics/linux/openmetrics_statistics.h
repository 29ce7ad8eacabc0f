// Thread safety: every member may be called from any thread.
//
// Statistics as one OpenMetrics text file:
//   spacekeep_report_total{domain="...",key="..."}            sum of the counts of addReportStat
//   spacekeep_distribution_bucket|_count|_sum{domain,key,le}  observations of addDistributionStat
// They start at zero with the process, as scrapers expect of counters.
#pragma once

#include <prometheus/counter.h>
#include <prometheus/family.h>
#include <prometheus/histogram.h>
#include <prometheus/registry.h>

#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "support/runtime/runtime.h"
#include "support/statistics/statistics.h"

namespace spacekeep {

class OpenMetricsStatistics : public Statistics {
 public:
  /// Runs `task` once, `delay_ns` from now, on any thread; may drop it when the process ends.
  using Schedule = std::function<void(std::uint64_t delay_ns, std::function<void()> task)>;

  /// Between a change and the file that shows it, and so between two files.
  static constexpr std::uint64_t kWriteDelayNs = 10'000'000'000;
  /// Distinct pairs of domain and key, counters and distributions together; further ones are
  /// dropped. Enough for a sum of each of the 4,096 services while few of them bring distributions.
  static constexpr std::size_t kMaxKeys = 4608;
  /// Of these, places that no key of a service takes: what the daemon counts of itself, such as
  /// events of low space, is never dropped for the sake of services, however many there are.
  static constexpr std::size_t kOwnKeys = 64;
  /// Counters of how often a percentage came, which end so, have a bound of their own: each service
  /// may bring any number of them, and would soon leave no room for a sum.
  static constexpr std::string_view kPercentEnd = ".percent";
  static constexpr std::size_t kMaxPercentKeys = 2048;
  /// Of these, places for the percentages of all services together.
  static constexpr std::size_t kOwnPercentKeys = 64;
  /// A longer domain or key is dropped.
  static constexpr std::size_t kMaxNameBytes = 256;

  /// Nothing is scheduled and nothing is written while nothing changes.
  OpenMetricsStatistics(std::string path, Schedule schedule);
  ~OpenMetricsStatistics() override;

  /// Dropped when it is negative or no number.
  void addDistributionStat(double value, std::string_view domain, std::string_view key) override;
  /// Dropped when it is negative: a counter never falls.
  void addReportStat(std::string_view domain, std::optional<std::string_view> key,
                     std::int64_t count) override;
  /// Writes the file now. False when it cannot be written, which is nobody's business but a test's.
  bool flush();

 private:
  class State;
  const std::shared_ptr<State> state_;
};

}  // namespace spacekeep
