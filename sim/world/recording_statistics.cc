#include "sim/world/recording_statistics.h"

#include <limits>
#include <set>

#include "support/runtime/locks.h"

namespace spacekeep::sim {

void RecordingStatistics::addDistributionStat(double value, std::string_view domain,
                                              std::string_view key) {
  trace_.add(StatisticSent{StatisticSent::Kind::kDistribution, std::string(domain),
                           std::string(key), value, 0});
  const std::scoped_lock lock(mutex_);
  foreign_domain_ = foreign_domain_ || domain != kStatisticsDomain;
  distributions_[std::string(key)].push_back(value);
}

void RecordingStatistics::addReportStat(std::string_view domain,
                                        std::optional<std::string_view> key, std::int64_t count) {
  if (!key) {
    const std::scoped_lock lock(mutex_);
    foreign_domain_ = foreign_domain_ || domain != kStatisticsDomain;
    ++reports_without_key_;
    return;
  }
  trace_.add(StatisticSent{StatisticSent::Kind::kReport, std::string(domain), std::string(*key), 0,
                           count});
  const std::scoped_lock lock(mutex_);
  foreign_domain_ = foreign_domain_ || domain != kStatisticsDomain;
  Report& report = reports_[std::string(*key)];
  // Services may claim any number; the counter of the daemon is a floating one, which only gets less exact.
  if (__builtin_add_overflow(report.sum, count, &report.sum)) {
    using Limits = std::numeric_limits<std::int64_t>;
    report.sum = count < 0 ? Limits::min() : Limits::max();
  }
  ++report.times;
}

std::vector<double> RecordingStatistics::distribution(std::string_view key) const {
  const std::scoped_lock lock(mutex_);
  const auto found = distributions_.find(key);
  return found == distributions_.end() ? std::vector<double>() : found->second;
}

std::uint64_t RecordingStatistics::timesReportedWithoutKey() const {
  const std::scoped_lock lock(mutex_);
  return reports_without_key_;
}

std::int64_t RecordingStatistics::reported(std::string_view key) const {
  const std::scoped_lock lock(mutex_);
  const auto found = reports_.find(key);
  return found == reports_.end() ? 0 : found->second.sum;
}

std::uint64_t RecordingStatistics::timesReported(std::string_view key) const {
  const std::scoped_lock lock(mutex_);
  const auto found = reports_.find(key);
  return found == reports_.end() ? 0 : found->second.times;
}

std::vector<std::string> RecordingStatistics::keys() const {
  std::set<std::string> keys;
  const std::scoped_lock lock(mutex_);
  for (const auto& [key, values] : distributions_) keys.insert(key);
  for (const auto& [key, report] : reports_) keys.insert(key);
  return {keys.begin(), keys.end()};
}

bool RecordingStatistics::onlyTheDaemonsDomain() const {
  const std::scoped_lock lock(mutex_);
  return !foreign_domain_;
}

}  // namespace spacekeep::sim
