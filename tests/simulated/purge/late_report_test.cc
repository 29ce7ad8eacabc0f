// A service that answers while the outcome is being filled in.
#include <gtest/gtest.h>

#include <functional>
#include <optional>
#include <string_view>
#include <utility>

#include "tests/both/purge/purge_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Does something of the test's when the purge counts its freed bytes, before they are recorded.
class StatisticsThatActAtTheTotal final : public Statistics {
 public:
  StatisticsThatActAtTheTotal(Statistics& recording, std::function<void()> act)
      : recording_(recording), act_(std::move(act)) {}

  void addDistributionStat(double value, std::string_view domain, std::string_view key) override {
    recording_.addDistributionStat(value, domain, key);
  }
  void addReportStat(std::string_view domain, std::optional<std::string_view> key,
                     std::int64_t count) override {
    if (key == "total.purged") act_();
    recording_.addReportStat(domain, key, count);
  }

 private:
  Statistics& recording_;
  const std::function<void()> act_;
};

/// The world's platform with other statistics.
Platform withStatistics(const Platform& platform, Statistics& statistics) {
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

TEST(PurgeLateReport, AnAnswerWhileTheTotalIsCountedIsStillInTheReportedSum) {
  inEverySchedule(kSchedules, [] {
    PurgeWorld world;
    sim::ServiceBehaviour held = sim::ownsBytes("/", 1000);
    held.purge = {sim::CallBehaviour{.answer = sim::Answer::kNever}};
    const auto late = world.add("late", held);
    bool answered = false;
    StatisticsThatActAtTheTotal statistics(world.platform.statistics, [&] {
      late->answerHeldCalls();
      answered = world.eventually([&] { return world.answers().size() == 1; });
    });
    Platform platform = withStatistics(world.platform, statistics);
    const auto operation = makeOperation<OpenPurgeOperation>(
        platform, Dictionary{{keys::kVolume, "/"}, {keys::kAmount, 100}, {keys::kUrgency, 1}},
        world.services);
    const Dictionary outcome = world.run(*operation);
    EXPECT_TRUE(answered);
    // What was freed had been measured by then.
    EXPECT_EQ(unsignedAt(outcome, keys::kAmount), 0U);
    EXPECT_EQ(unsignedAt(outcome, keys::kAmountReported), 100U);
    world.world.shutDown();
  });
}

}  // namespace
}  // namespace spacekeep::test
