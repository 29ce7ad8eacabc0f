#include "support/statistics/linux/openmetrics_statistics.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <mutex>
#include <optional>
#include <span>
#include <string_view>

#include "support/files/linux/atomic_file.h"
#include "support/statistics/linux/openmetrics_text.h"
#include "support/values/text.h"

namespace spacekeep {
namespace {

using Key = std::pair<std::string, std::string>;  // domain, key

// Bytes and nanoseconds alike: powers of ten from a kilobyte or microsecond to a terabyte or
// quarter of an hour.
const prometheus::Histogram::BucketBoundaries& buckets() {
  static const prometheus::Histogram::BucketBoundaries bounds{0,   1e3, 1e4,  1e5,  1e6, 1e7,
                                                              1e8, 1e9, 1e10, 1e11, 1e12};
  return bounds;
}

// None for what no label may be.
std::optional<Key> keyOf(std::string_view domain, std::string_view key) {
  constexpr std::size_t kMost = OpenMetricsStatistics::kMaxNameBytes;
  if (domain.size() > kMost || key.size() > kMost) return std::nullopt;
  return Key(lineOf(domain), lineOf(key));
}

constexpr std::string_view kSumOfAll = "total.purged";

/// By its end, which the daemon puts behind the ID of a service. The ID itself may be anything.
bool isOfService(const Key& key) {
  constexpr std::array<std::string_view, 3> kEnds = {".purged", "_purgeElapsedNanoseconds",
                                                     "_purgeableElapsedNanoseconds"};
  return key.second != kSumOfAll &&
         std::any_of(kEnds.begin(), kEnds.end(),
                     [&key](std::string_view end) { return key.second.ends_with(end); });
}

bool isPercentage(const Key& key) {
  return key.second.ends_with(OpenMetricsStatistics::kPercentEnd);
}

bool isPercentageOfService(const Key& key) {
  return isPercentage(key) && !key.second.starts_with(kSumOfAll);
}

prometheus::Labels labelsOf(const Key& key) { return {{"domain", key.first}, {"key", key.second}}; }

}  // namespace

// Outlives its owner while a scheduled write still refers to it.
class OpenMetricsStatistics::State : public std::enable_shared_from_this<State> {
 public:
  State(std::string path, Schedule schedule)
      : path_(std::move(path)), schedule_(std::move(schedule)) {}

  void observe(double value, const Key& key) {
    std::unique_lock lock(mutex_);
    prometheus::Histogram* histogram = histogramOf(key);
    if (histogram == nullptr) return;
    histogram->Observe(value);
    changed(std::move(lock));
  }

  void count(std::int64_t count, const Key& key) {
    std::unique_lock lock(mutex_);
    prometheus::Counter* counter = counterOf(key);
    if (counter == nullptr) return;
    counter->Increment(static_cast<double>(count));
    changed(std::move(lock));
  }

  bool write() {
    const std::scoped_lock one_writer(write_mutex_);
    std::string text;
    {
      const std::scoped_lock lock(mutex_);
      changed_ = false;
      text = openMetricsText(registry_.Collect());
    }
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    return !replaceFile(path_, std::span(bytes, text.size()), Durability::kVolatile);
  }

 private:
  [[nodiscard]] bool fullForPercentage(const Key& key) const {
    if (percent_keys_ >= kMaxPercentKeys) return true;
    return isPercentageOfService(key) && service_percent_keys_ >= kMaxPercentKeys - kOwnPercentKeys;
  }
  [[nodiscard]] bool fullFor(const Key& key) const {
    if (counters_.size() - percent_keys_ + histograms_.size() >= kMaxKeys) return true;
    return isOfService(key) && service_keys_ >= kMaxKeys - kOwnKeys;
  }

  prometheus::Counter* counterOf(const Key& key) {
    if (const auto found = counters_.find(key); found != counters_.end()) return found->second;
    if (isPercentage(key) ? fullForPercentage(key) : fullFor(key)) return nullptr;
    if (isPercentage(key)) ++percent_keys_;
    if (isPercentageOfService(key)) ++service_percent_keys_;
    if (isOfService(key)) ++service_keys_;
    prometheus::Counter& counter = reports_.Add(labelsOf(key));
    counters_.emplace(key, &counter);
    return &counter;
  }

  prometheus::Histogram* histogramOf(const Key& key) {
    if (const auto found = histograms_.find(key); found != histograms_.end()) return found->second;
    if (fullFor(key)) return nullptr;
    if (isOfService(key)) ++service_keys_;
    prometheus::Histogram& histogram = distributions_.Add(labelsOf(key), buckets());
    histograms_.emplace(key, &histogram);
    return &histogram;
  }

  // The first change since the last write schedules the next one; an idle process has none. A write
  // that was scheduled before a flush stays pending and serves the changes after it.
  void changed(std::unique_lock<rt::Mutex> lock) {
    changed_ = true;
    if (scheduled_) return;
    scheduled_ = true;
    lock.unlock();
    schedule_(kWriteDelayNs, [weak = weak_from_this()] {
      if (const auto state = weak.lock()) state->runScheduled();
    });
  }

  void runScheduled() {
    {
      const std::scoped_lock lock(mutex_);
      scheduled_ = false;
      if (!changed_) return;
    }
    static_cast<void>(write());
  }

  const std::string path_;
  const Schedule schedule_;
  rt::Mutex write_mutex_;  // held around a whole write; taken before mutex_

  rt::Mutex mutex_;  // guards all below
  bool changed_ = false;
  bool scheduled_ = false;
  prometheus::Registry registry_;
  prometheus::Family<prometheus::Counter>& reports_ =
      prometheus::BuildCounter()
          .Name("spacekeep_report")
          .Help("Events and amounts that the daemon reported.")
          .Register(registry_);
  prometheus::Family<prometheus::Histogram>& distributions_ =
      prometheus::BuildHistogram()
          .Name("spacekeep_distribution")
          .Help("Observations of the daemon, in bytes or nanoseconds as the key says.")
          .Register(registry_);
  std::map<Key, prometheus::Counter*> counters_;
  std::size_t percent_keys_ = 0;          // among the counters
  std::size_t service_percent_keys_ = 0;  // among these
  std::size_t service_keys_ = 0;          // of services, percentages left out
  std::map<Key, prometheus::Histogram*> histograms_;
};

OpenMetricsStatistics::OpenMetricsStatistics(std::string path, Schedule schedule)
    : state_(std::make_shared<State>(std::move(path), std::move(schedule))) {}

OpenMetricsStatistics::~OpenMetricsStatistics() = default;

void OpenMetricsStatistics::addDistributionStat(double value, std::string_view domain,
                                                std::string_view key) {
  if (!std::isfinite(value) || value < 0) return;
  if (const auto name = keyOf(domain, key)) state_->observe(value, *name);
}

void OpenMetricsStatistics::addReportStat(std::string_view domain,
                                          std::optional<std::string_view> key, std::int64_t count) {
  if (!key || count < 0) return;
  if (const auto name = keyOf(domain, *key)) state_->count(count, *name);
}

bool OpenMetricsStatistics::flush() { return state_->write(); }

}  // namespace spacekeep
