// Thread safety: as the statistics that it passes everything on to; the act runs on the thread that
// reports.
//
// Statistics that do something of the test's in the middle of a purge: when one of its keys is reported.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "tests/both/purge/purge_world.h"

namespace spacekeep::test {

class ActingStatistics final : public Statistics {
 public:
  ActingStatistics(Statistics& recording, std::string key, std::function<void()> act)
      : recording_(recording), key_(std::move(key)), act_(std::move(act)) {}

  void addDistributionStat(double value, std::string_view domain, std::string_view key) override {
    if (key == key_) act_();
    recording_.addDistributionStat(value, domain, key);
  }
  void addReportStat(std::string_view domain, std::optional<std::string_view> key,
                     std::int64_t count) override {
    if (key == key_) act_();
    recording_.addReportStat(domain, key, count);
  }

 private:
  Statistics& recording_;
  const std::string key_;
  const std::function<void()> act_;
};

/// The platform with other statistics.
inline Platform withStatistics(const Platform& platform, Statistics& statistics) {
  return {.global = platform.global,
          .volumes = platform.volumes,
          .access = platform.access,
          .statistics = statistics,
          .files = platform.files,
          .connector = platform.connector,
          .services = platform.services,
          .openPreferencesSuite = platform.openPreferencesSuite,
          .makeListener = platform.makeListener,
          .after = platform.after,
          .createSpacekeepToken = platform.createSpacekeepToken};
}

}  // namespace spacekeep::test
