// How many lines a flood of refusals makes, by the virtual clock.
#include "support/access/refusal_lines.h"

#include <gtest/gtest.h>

#include "support/access/entitlement_access.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/simulated/one_schedule.h"

namespace spacekeep::access {
namespace {

using test::LogCapture;

constexpr const char* kLack = "lacks CLIENT_ENTITLEMENT, no rule grants it";
constexpr const char* kCounted = "such lines are counted and not written";

/// As often as it likes, each time as a new peer, all within a millisecond.
void knock(EntitlementAccess& access, std::uint32_t user, int times) {
  for (int i = 0; i < times; ++i) {
    EXPECT_FALSE(access.isEntitled(PeerIdentity({.uid = user}), "CLIENT_ENTITLEMENT"));
  }
  rt::sleepNs(1'000'000);
}

std::vector<Rule> rulesForRoot() {
  Rule rule;
  rule.name = "10-root.plist";
  rule.users = {0};
  rule.grants = {"CLIENT_ENTITLEMENT"};
  return {rule};
}

TEST(RefusalLines, AFloodOfOneUserMakesTwentyLinesAndOneThatSaysSo) {
  runOneSchedule({}, [] {
    const LogCapture log;
    EntitlementAccess access(rulesForRoot());
    knock(access, 1000, 20);
    EXPECT_EQ(log.count(kLogProblem, kLack), 20U);
    EXPECT_EQ(log.count(kLogProblem, kCounted), 0U);
    knock(access, 1000, 1230);
    EXPECT_EQ(log.count(kLogProblem, kLack), 20U);
    EXPECT_EQ(log.texts(kLogProblem).size(), 21U);
    EXPECT_EQ(log.texts(kLogProblem).back(),
              "connectionIsEntitled user 1000 is refused CLIENT_ENTITLEMENT: for a while such "
              "lines are counted and not written");
  });
}

TEST(RefusalLines, TheFloodOfOneUserHidesNoOtherUserOrEntitlement) {
  runOneSchedule({}, [] {
    const LogCapture log;
    EntitlementAccess access(rulesForRoot());
    knock(access, 1000, 500);
    knock(access, 1001, 1);
    EXPECT_EQ(log.count(kLogProblem, "peer uid 1001"), 1U);
    EXPECT_FALSE(access.isEntitled(PeerIdentity({.uid = 1000}), "PURGE_ENTITLEMENT"));
    EXPECT_EQ(log.count(kLogProblem, "lacks PURGE_ENTITLEMENT"), 1U);
  });
}

TEST(RefusalLines, ManyUsersTogetherMakeAHundredLines) {
  runOneSchedule({}, [] {
    const LogCapture log;
    EntitlementAccess access(rulesForRoot());
    for (std::uint32_t user = 1; user <= 500; ++user) {
      static_cast<void>(access.isEntitled(PeerIdentity({.uid = user}), "CLIENT_ENTITLEMENT"));
    }
    EXPECT_EQ(log.count(kLogProblem, kLack), 100U);
    EXPECT_EQ(log.count(kLogProblem, kCounted), 1U);
  });
}

TEST(RefusalLines, AfterTheWindowLinesGoOutAgainWithTheCountOfWhatWasLeftOut) {
  runOneSchedule({}, [] {
    const LogCapture log;
    EntitlementAccess access(rulesForRoot());
    knock(access, 1000, 50);
    rt::sleepNs(RefusalLines::kWindowNs - 2'000'000);
    knock(access, 1000, 1);
    EXPECT_EQ(log.count(kLogProblem, kLack), 20U);
    rt::sleepNs(1'000'000);
    knock(access, 1000, 1);
    EXPECT_EQ(log.count(kLogProblem, kLack), 21U);
    EXPECT_EQ(log.countExact(kLogProblem, "connectionIsEntitled 31 more refusals were not written"),
              1U);
  });
}

TEST(RefusalLines, TheCountAlsoGoesOutWithTheNextPeerThatIsLetIn) {
  runOneSchedule({}, [] {
    const LogCapture log;
    EntitlementAccess access(rulesForRoot());
    knock(access, 1000, 25);
    EXPECT_TRUE(access.isEntitled(PeerIdentity({.uid = 0}), "CLIENT_ENTITLEMENT"));
    EXPECT_EQ(log.count(kLogProblem, "were not written"), 0U);
    rt::sleepNs(RefusalLines::kWindowNs);
    EXPECT_TRUE(access.isEntitled(PeerIdentity({.uid = 0}), "CLIENT_ENTITLEMENT"));
    EXPECT_EQ(log.countExact(kLogProblem, "connectionIsEntitled 5 more refusals were not written"),
              1U);
    EXPECT_TRUE(access.isEntitled(PeerIdentity({.uid = 0}), "CLIENT_ENTITLEMENT"));
    EXPECT_EQ(log.count(kLogProblem, "were not written"), 1U);
  });
}

}  // namespace
}  // namespace spacekeep::access
