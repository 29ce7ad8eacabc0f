#include "sim/scenarios/system_scenario.h"

#include <gtest/gtest.h>

#include <set>

#include "sim/scenarios/system_run.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSeeds = 2000;

TEST(SystemScenario, IsAPureFunctionOfTheSeed) {
  std::set<std::string> texts;
  for (std::uint64_t seed = 1; seed <= 50; ++seed) {
    const std::string text = textOf(deriveSystemScenario(seed));
    EXPECT_EQ(text, textOf(deriveSystemScenario(seed))) << "seed " << seed;
    texts.insert(text);
  }
  EXPECT_EQ(texts.size(), 50U);
}

TEST(SystemScenario, EveryElementCanBeTakenAwayAndIsToldOnALine) {
  const SystemPlan plan = deriveSystemScenario(7);
  const std::size_t count = elementCount(plan);
  ASSERT_GT(count, 3U);
  for (std::size_t i = 0; i < count; ++i) {
    EXPECT_FALSE(textOfElement(plan, i).empty());
    EXPECT_EQ(elementCount(withoutElement(plan, i)), count - 1);
    EXPECT_NE(textOf(withoutElement(plan, i)), textOf(plan));
  }
}

TEST(SystemScenario, TakingAwayWhatIsNotThereChangesNothing) {
  const SystemPlan plan = deriveSystemScenario(7);
  EXPECT_EQ(textOf(withoutElement(plan, elementCount(plan))), textOf(plan));
}

TEST(SystemScenario, EveryFaultIsDrawnAloneAndBesideOthersAndNotAtAll) {
  std::set<Fault> alone;
  std::set<Fault> beside;
  bool none = false;
  for (std::uint64_t seed = 1; seed <= kSeeds; ++seed) {
    const std::set<Fault> faults = deriveSystemScenario(seed).faults;
    none = none || faults.empty();
    if (faults.size() == 1) alone.insert(*faults.begin());
    if (faults.size() > 1) beside.insert(faults.begin(), faults.end());
  }
  EXPECT_TRUE(none);
  EXPECT_EQ(beside.size(), kFaultCount);
  // A silent ping is rare and never drawn for itself.
  EXPECT_GE(alone.size(), kFaultCount - 1);
}

TEST(SystemScenario, FaultsHaveNamesOfTheirOwn) {
  std::set<std::string_view> names;
  for (std::size_t i = 0; i < kFaultCount; ++i) names.insert(nameOf(static_cast<Fault>(i)));
  EXPECT_EQ(names.size(), kFaultCount);
}

// Without them nothing could be promised, see the head of the scenario.
TEST(SystemScenario, NoServiceClaimsForEverWhatItDidNotFree) {
  for (std::uint64_t seed = 1; seed <= kSeeds; ++seed) {
    for (const SystemService& service : deriveSystemScenario(seed).services) {
      const CallBehaviour& last = service.behaviour.purge.back();
      EXPECT_LE(last.percent_reported, 100U);
      EXPECT_EQ(last.reported_extra, 0U);
      EXPECT_EQ(last.space_returns_after_ns, 0U);
    }
  }
}

TEST(SystemScenario, NoTwoPurgesOfClientsNeedTheSameNumberOfBytes) {
  for (std::uint64_t seed = 1; seed <= kSeeds; ++seed) {
    std::set<std::uint64_t> amounts;
    for (const PlannedAction& action : deriveSystemScenario(seed).actions) {
      const auto* call = std::get_if<CallAction>(&action.what);
      if (call == nullptr || call->member != "clientPurge") continue;
      const auto amount = unsignedAt(call->info, "SPACEKEEP_AMOUNT");
      if (!amount) continue;
      EXPECT_TRUE(amounts.insert(*amount).second) << "seed " << seed;
    }
  }
}

}  // namespace
}  // namespace spacekeep::sim
