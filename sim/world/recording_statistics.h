// Thread safety: every member may be called from any thread.
//
// Statistics that are kept, for tests to look at.
#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "sim/world/trace.h"
#include "support/runtime/runtime.h"
#include "support/statistics/statistics.h"

namespace spacekeep::sim {

class RecordingStatistics final : public Statistics {
 public:
  explicit RecordingStatistics(Trace& trace) : trace_(trace) {}

  void addDistributionStat(double value, std::string_view domain, std::string_view key) override;
  /// Without a key nothing is recorded.
  void addReportStat(std::string_view domain, std::optional<std::string_view> key,
                     std::int64_t count) override;

  /// Every observation, in order.
  [[nodiscard]] std::vector<double> distribution(std::string_view key) const;
  /// The sum of the counts, 0 when the key was never sent.
  [[nodiscard]] std::int64_t reported(std::string_view key) const;
  [[nodiscard]] std::uint64_t timesReported(std::string_view key) const;
  [[nodiscard]] std::uint64_t timesReportedWithoutKey() const;
  /// All keys of both kinds, sorted, each once.
  [[nodiscard]] std::vector<std::string> keys() const;
  /// True when every statistic so far named the daemon's domain.
  [[nodiscard]] bool onlyTheDaemonsDomain() const;

 private:
  struct Report {
    std::int64_t sum = 0;
    std::uint64_t times = 0;
  };

  Trace& trace_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<std::string, std::vector<double>, std::less<>> distributions_;
  std::map<std::string, Report, std::less<>> reports_;
  std::uint64_t reports_without_key_ = 0;
  bool foreign_domain_ = false;
};

}  // namespace spacekeep::sim
