#include "support/statistics/linux/openmetrics_statistics.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <thread>
#include <vector>

#include "tests/helpers/temporary_directory.h"

namespace spacekeep {
namespace {

using test::contentOf;
using test::TemporaryDirectory;

// Keeps what is scheduled until the test lets it run.
struct Schedule {
  std::vector<std::pair<std::uint64_t, std::function<void()>>> tasks;

  OpenMetricsStatistics::Schedule function() {
    return [this](std::uint64_t delay_ns, std::function<void()> task) {
      tasks.emplace_back(delay_ns, std::move(task));
    };
  }
  void runAll() {
    auto due = std::exchange(tasks, {});
    for (auto& [delay_ns, task] : due) task();
  }
};

class Statistic : public testing::Test {
 protected:
  std::string text() {
    EXPECT_TRUE(statistics_.flush());
    return contentOf(path_);
  }
  void report(std::optional<std::string_view> key, std::int64_t count) {
    statistics_.addReportStat(kStatisticsDomain, key, count);
  }
  void observe(std::string_view key, double value) {
    statistics_.addDistributionStat(value, kStatisticsDomain, key);
  }

  TemporaryDirectory directory_;
  const std::string path_ = directory_ / "metrics.txt";
  Schedule schedule_;
  OpenMetricsStatistics statistics_{path_, schedule_.function()};
};

bool hasLine(const std::string& text, const std::string& line) {
  return text.starts_with(line + "\n") || text.find("\n" + line + "\n") != std::string::npos;
}

std::size_t linesWith(const std::string& text, std::string_view part) {
  std::size_t count = 0;
  for (std::size_t at = text.find(part); at != std::string::npos; at = text.find(part, at + 1))
    ++count;
  return count;
}

TEST_F(Statistic, CountsAddUpUnderTheirKey) {
  report("SK_LOWDISK_EVENT", 1);
  report("SK_LOWDISK_EVENT", 1);
  report("com.example.cache.purged", 1'000'000'000'000);
  EXPECT_EQ(text(),
            "# TYPE spacekeep_report counter\n"
            "# HELP spacekeep_report Events and amounts that the daemon reported.\n"
            "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key=\"SK_LOWDISK_EVENT\"} 2\n"
            "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key=\"com.example.cache."
            "purged\"} 1e+12\n"
            "# EOF\n");
}

TEST_F(Statistic, ObservationsAreCountedInBuckets) {
  observe("SpacekeepPurgeDeficit", 0);
  observe("SpacekeepPurgeDeficit", 1500);
  observe("SpacekeepPurgeDeficit", 5e15);
  const std::string file = text();
  const std::string labels = "{domain=\"com.quorvel.spacekeep\",key=\"SpacekeepPurgeDeficit\"";
  EXPECT_TRUE(hasLine(file, "# TYPE spacekeep_distribution histogram"));
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_bucket" + labels + ",le=\"0.0\"} 1")) << file;
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_bucket" + labels + ",le=\"1000.0\"} 1"));
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_bucket" + labels + ",le=\"10000.0\"} 2"));
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_bucket" + labels + ",le=\"+Inf\"} 3"));
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_count" + labels + "} 3"));
  EXPECT_TRUE(hasLine(file, "spacekeep_distribution_sum" + labels + "} 5000000000001500"));
  EXPECT_TRUE(file.ends_with("# EOF\n"));
}

TEST_F(Statistic, WhatCannotBeRecordedIsDropped) {
  report(std::nullopt, 1);
  report("falls", -1);
  report("falls", INT64_MIN);
  report(std::string(257, 'k'), 1);
  statistics_.addReportStat(std::string(257, 'd'), "k", 1);
  for (const double value : {-1.0, std::nan(""), std::numeric_limits<double>::infinity(),
                             -std::numeric_limits<double>::infinity()})
    observe("bad", value);
  EXPECT_TRUE(schedule_.tasks.empty());
  const std::string file = text();
  EXPECT_EQ(linesWith(file, "{"), 0u) << file;
  EXPECT_TRUE(file.ends_with("# EOF\n"));
}

TEST_F(Statistic, KeysAreEscapedAndCannotForgeALine) {
  report("a\"b\\c\nspacekeep_report_total 9", 1);
  report("\xff", 1);
  const std::string file = text();
  EXPECT_TRUE(hasLine(file,
                      "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key="
                      "\"a\\\"b\\\\c\\\\nspacekeep_report_total 9\"} 1"))
      << file;
  EXPECT_TRUE(
      hasLine(file, "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key=\"\\\\xff\"} 1"));
  EXPECT_EQ(linesWith(file, "\n"), 5u);
}

TEST_F(Statistic, DistinctKeysAreBounded) {
  for (std::size_t i = 0; i < OpenMetricsStatistics::kMaxKeys + 10; ++i)
    report("k" + std::to_string(i), 1);
  observe("one more", 1);
  report("k0", 1);
  const std::string file = text();
  EXPECT_EQ(linesWith(file, "spacekeep_report_total{"), OpenMetricsStatistics::kMaxKeys);
  EXPECT_EQ(linesWith(file, "one more"), 0u);
  EXPECT_TRUE(
      hasLine(file, "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key=\"k0\"} 2"));
}

TEST_F(Statistic, PercentagesWithoutEndLeaveRoomForSumsAndDistributions) {
  constexpr std::size_t kMost =
      OpenMetricsStatistics::kMaxPercentKeys - OpenMetricsStatistics::kOwnPercentKeys;
  for (std::size_t i = 0; i < kMost + 10; ++i)
    report("cache.purged." + std::to_string(10 * i) + ".percent", 1);
  for (std::size_t i = 0; i < 4096; ++i) report("service" + std::to_string(i) + ".purged", 1);
  observe("SpacekeepPurgeDeficit", 1);
  report("cache.purged.10.percent", 1);
  const std::string file = text();
  EXPECT_EQ(linesWith(file, ".percent\"} "), kMost);
  EXPECT_EQ(linesWith(file, ".purged\"} "), 4096U);
  EXPECT_TRUE(hasLine(file,
                      "spacekeep_distribution_count{domain=\"com.quorvel.spacekeep\",key="
                      "\"SpacekeepPurgeDeficit\"} 1"));
  EXPECT_TRUE(hasLine(file,
                      "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key="
                      "\"cache.purged.10.percent\"} 2"));
}

TEST_F(Statistic, PercentagesOfServicesLeaveRoomForThoseOfAllTogether) {
  constexpr std::size_t kMost = OpenMetricsStatistics::kMaxPercentKeys;
  for (std::size_t i = 0; i < kMost; ++i) report("s.purged." + std::to_string(i) + ".percent", 1);
  for (std::size_t i = 0; i < kMost; ++i)
    report("total.purged." + std::to_string(i) + ".percent", 1);
  const std::string file = text();
  EXPECT_EQ(linesWith(file, "\"total.purged."), OpenMetricsStatistics::kOwnPercentKeys);
  EXPECT_EQ(linesWith(file, ".percent\"} "), kMost);
}

TEST_F(Statistic, ManyServicesLeaveRoomForWhatTheDaemonCountsOfItself) {
  for (std::size_t i = 0; i < OpenMetricsStatistics::kMaxKeys / 2; ++i) {
    report("service" + std::to_string(i) + ".purged", 1);
    observe("service" + std::to_string(i) + "_purgeElapsedNanoseconds", 1);
  }
  observe("one more_purgeableElapsedNanoseconds", 1);
  report("SK_LOWDISK_EVENT", 1);
  observe("SpacekeepPurgeElapsedNanoseconds", 1);
  report("service0.purged", 1);
  const std::string file = text();
  EXPECT_EQ(linesWith(file, ".purged\"} ") + linesWith(file, "_count{") - 1,
            OpenMetricsStatistics::kMaxKeys - OpenMetricsStatistics::kOwnKeys);
  EXPECT_EQ(linesWith(file, "one more"), 0U);
  const std::string domain = "{domain=\"com.quorvel.spacekeep\",key=";
  EXPECT_TRUE(hasLine(file, "spacekeep_report_total" + domain + "\"SK_LOWDISK_EVENT\"} 1"));
  EXPECT_TRUE(hasLine(
      file, "spacekeep_distribution_count" + domain + "\"SpacekeepPurgeElapsedNanoseconds\"} 1"));
  EXPECT_TRUE(hasLine(file, "spacekeep_report_total" + domain + "\"service0.purged\"} 2"));
}

TEST_F(Statistic, NothingIsScheduledOrWrittenWhileNothingChanges) {
  EXPECT_TRUE(schedule_.tasks.empty());
  EXPECT_FALSE(std::filesystem::exists(path_));
  report("k", 1);
  schedule_.runAll();
  EXPECT_TRUE(std::filesystem::exists(path_));
  EXPECT_TRUE(schedule_.tasks.empty());
}

TEST_F(Statistic, ManyChangesAreOneWriteTenSecondsAfterTheFirst) {
  for (int i = 0; i < 100; ++i) report("k", 1);
  ASSERT_EQ(schedule_.tasks.size(), 1u);
  EXPECT_EQ(schedule_.tasks[0].first, 10'000'000'000u);
  EXPECT_FALSE(std::filesystem::exists(path_));
  schedule_.runAll();
  EXPECT_NE(contentOf(path_).find("\"k\"} 100\n"), std::string::npos);
  report("k", 1);
  EXPECT_EQ(schedule_.tasks.size(), 1u);
}

TEST_F(Statistic, AFlushWritesAtOnceAndTheScheduledWriteThenHasNothingToDo) {
  report("k", 1);
  EXPECT_NE(text().find("\"k\"} 1\n"), std::string::npos);
  ASSERT_TRUE(std::filesystem::remove(path_));
  schedule_.runAll();
  EXPECT_FALSE(std::filesystem::exists(path_));
  report("k", 1);
  schedule_.runAll();
  EXPECT_NE(contentOf(path_).find("\"k\"} 2\n"), std::string::npos);
}

TEST(StatisticFile, AFailedWriteIsDroppedInSilenceAndALaterOneHasEverything) {
  const TemporaryDirectory directory;
  Schedule schedule;
  OpenMetricsStatistics statistics(directory / "run/metrics.txt", schedule.function());
  statistics.addReportStat(kStatisticsDomain, "k", 1);
  testing::internal::CaptureStderr();
  schedule.runAll();
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "");
  std::filesystem::create_directory(directory / "run");
  statistics.addReportStat(kStatisticsDomain, "k", 1);
  schedule.runAll();
  EXPECT_NE(contentOf(directory / "run/metrics.txt").find("\"k\"} 2\n"), std::string::npos);
}

TEST(StatisticFile, AWriteThatIsDueAfterTheEndDoesNothing) {
  const TemporaryDirectory directory;
  Schedule schedule;
  {
    OpenMetricsStatistics statistics(directory / "metrics.txt", schedule.function());
    statistics.addReportStat(kStatisticsDomain, "k", 1);
  }
  schedule.runAll();
  EXPECT_FALSE(std::filesystem::exists(directory / "metrics.txt"));
}

TEST(StatisticFile, ThreadsThatReportAtOnceLoseNothing) {
  const TemporaryDirectory directory;
  OpenMetricsStatistics statistics(
      directory / "metrics.txt", [](std::uint64_t, const std::function<void()>& task) { task(); });
  std::vector<std::thread> threads;
  for (int number = 0; number < 4; ++number) {
    threads.emplace_back([&statistics] {
      for (int i = 0; i < 200; ++i) {
        statistics.addReportStat(kStatisticsDomain, "shared", 1);
        statistics.addDistributionStat(i, kStatisticsDomain, "shared");
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  ASSERT_TRUE(statistics.flush());
  const std::string file = contentOf(directory / "metrics.txt");
  EXPECT_TRUE(
      hasLine(file, "spacekeep_report_total{domain=\"com.quorvel.spacekeep\",key=\"shared\"} 800"))
      << file;
  EXPECT_TRUE(hasLine(
      file, "spacekeep_distribution_count{domain=\"com.quorvel.spacekeep\",key=\"shared\"} 800"));
}

}  // namespace
}  // namespace spacekeep
