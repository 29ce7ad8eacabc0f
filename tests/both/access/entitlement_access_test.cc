#include "support/access/entitlement_access.h"

#include <gtest/gtest.h>

#include "tests/helpers/log_capture.h"

namespace spacekeep::access {
namespace {

using test::LogCapture;

class Peer final : public ipc::PeerConnection {
 public:
  explicit Peer(std::uint32_t uid)
      : identity_({.uid = uid, .gid = 5, .groups = {}, .label = {}, .pid = 77}) {}
  [[nodiscard]] const PeerIdentity& identity() const override { return identity_; }

 private:
  PeerIdentity identity_;
};

std::vector<Rule> rules() {
  Rule clients;
  clients.name = "20-clients.plist";
  clients.users = {1, 2};
  clients.grants = {"CLIENT_ENTITLEMENT", "PURGE_ENTITLEMENT"};
  Rule outcast;
  outcast.name = "99-outcast.plist";
  outcast.users = {2};
  outcast.denies = {"PURGE_ENTITLEMENT"};
  return {clients, outcast};
}

TEST(EntitlementAccess, NoConnectionHoldsNothing) {
  EntitlementAccess access(rules());
  EXPECT_FALSE(access.connectionIsEntitled(nullptr, {"CLIENT_ENTITLEMENT"}));
  EXPECT_FALSE(access.connectionIsEntitled(nullptr, {}));
}

TEST(EntitlementAccess, EveryNamedEntitlementMustBeHeld) {
  EntitlementAccess access(rules());
  Peer first(1);
  Peer second(2);
  EXPECT_TRUE(access.connectionIsEntitled(&first, {"CLIENT_ENTITLEMENT", "PURGE_ENTITLEMENT"}));
  EXPECT_TRUE(access.connectionIsEntitled(&second, {"CLIENT_ENTITLEMENT"}));
  EXPECT_FALSE(access.connectionIsEntitled(&second, {"CLIENT_ENTITLEMENT", "PURGE_ENTITLEMENT"}));
}

TEST(EntitlementAccess, EachVerdictIsLoggedOncePerPeerWithTheRule) {
  const LogCapture log;
  EntitlementAccess access(rules());
  Peer peer(2);
  for (int i = 0; i < 3; ++i) {
    EXPECT_TRUE(access.connectionIsEntitled(&peer, {"CLIENT_ENTITLEMENT"}));
    EXPECT_FALSE(access.connectionIsEntitled(&peer, {"PURGE_ENTITLEMENT"}));
    EXPECT_FALSE(access.connectionIsEntitled(&peer, {"SERVICE_ENTITLEMENT"}));
  }
  EXPECT_EQ(log.texts(kLogTrace),
            (std::vector<std::string>{"connectionIsEntitled peer uid 2 gid 5 pid 77 holds "
                                      "CLIENT_ENTITLEMENT by rule 20-clients.plist"}));
  EXPECT_EQ(log.texts(kLogProblem),
            (std::vector<std::string>{"connectionIsEntitled peer uid 2 gid 5 pid 77 is denied "
                                      "PURGE_ENTITLEMENT by rule 99-outcast.plist",
                                      "connectionIsEntitled peer uid 2 gid 5 pid 77 lacks "
                                      "SERVICE_ENTITLEMENT, no rule grants it"}));
  Peer again(2);
  EXPECT_TRUE(access.connectionIsEntitled(&again, {"CLIENT_ENTITLEMENT"}));
  EXPECT_EQ(log.texts(kLogTrace).size(), 2U);
}

TEST(EntitlementAccess, ADenialOfWhatIsUnclearIsSaidToBeOne) {
  const LogCapture log;
  Rule denial;
  denial.name = "50-unit.plist";
  denial.units = {"cache.service"};
  denial.denies = {"PURGE_ENTITLEMENT"};
  EntitlementAccess access({denial});
  const PeerIdentity peer({.uid = 1, .gid = 5, .unclear = {.unit = true}});
  EXPECT_FALSE(access.isEntitled(peer, "PURGE_ENTITLEMENT"));
  EXPECT_EQ(log.texts(kLogProblem),
            (std::vector<std::string>{"connectionIsEntitled peer uid 1 gid 5 pid 0 is denied "
                                      "PURGE_ENTITLEMENT by rule 50-unit.plist, which may be about "
                                      "it: that is unclear"}));
}

TEST(EntitlementAccess, OnlySoManyVerdictsAreRemembered) {
  EntitlementAccess access(rules(), 3);
  for (std::uint32_t i = 0; i < 20; ++i) {
    Peer peer(1);
    EXPECT_TRUE(access.connectionIsEntitled(&peer, {"CLIENT_ENTITLEMENT"}));
    EXPECT_LE(access.remembered(), 3U);
  }
  EXPECT_EQ(access.remembered(), 3U);
}

TEST(EntitlementAccess, AForgottenVerdictIsTheSameAgain) {
  EntitlementAccess access(rules(), 1);
  Peer peer(2);
  for (int i = 0; i < 3; ++i) {
    EXPECT_TRUE(access.connectionIsEntitled(&peer, {"CLIENT_ENTITLEMENT"}));
    EXPECT_FALSE(access.connectionIsEntitled(&peer, {"PURGE_ENTITLEMENT"}));
  }
}

}  // namespace
}  // namespace spacekeep::access
