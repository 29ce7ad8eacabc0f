// What peers with fewer rights get from the real daemon.
#include <gtest/gtest.h>

#include <csignal>
#include <string>

#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

constexpr uid_t kClientUser = 4001;   // may connect and ask how much could be freed
constexpr uid_t kServiceUser = 4002;  // may connect and check in
constexpr uid_t kStranger = 4003;     // no rule names it

std::string rule(uid_t user, const std::string& grants) {
  return "<plist version=\"1.0\"><dict><key>MATCH_USER</key><array><integer>" +
         std::to_string(user) + "</integer></array><key>GRANT</key><array>" + grants +
         "</array></dict></plist>";
}

std::string granted(const std::string& entitlement) {
  return "<string>" + entitlement + "</string>";
}

class Rights : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("tmp", "tmpfs", 16);
    sandbox_.start();
    sandbox_.write(
        "/etc/spacekeep/entitlements.d/clients.plist",
        rule(kClientUser, granted("CLIENT_ENTITLEMENT") + granted("PURGEABLE_ENTITLEMENT")));
    sandbox_.write(
        "/etc/spacekeep/entitlements.d/services.plist",
        rule(kServiceUser, granted("CLIENT_ENTITLEMENT") + granted("SERVICE_ENTITLEMENT")));
    daemon_ = sandbox_.startDaemon();
  }

  std::string answerTo(uid_t user, const std::vector<std::string>& request) {
    std::vector<std::string> command = {"/programs/tests/test-peer"};
    command.insert(command.end(), request.begin(), request.end());
    const std::string log = "peer-" + std::to_string(user) + ".log";
    sandbox_.spawn(command, log, user, user).wait();
    return sandbox_.read("/tmp/" + log);
  }

  Sandbox sandbox_;
  Process daemon_;
};

TEST_F(Rights, APeerWithoutTheClientEntitlementIsRefusedAtTheDoor) {
  const std::string answer = answerTo(kStranger, {"purge", "/volumes/tmp", "0"});
  EXPECT_NE(answer.find("error: "), std::string::npos) << answer;
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "CLIENT_ENTITLEMENT"))
      << sandbox_.daemonLog();
  EXPECT_NE(sandbox_.daemonLog().find(std::to_string(kStranger)), std::string::npos);
}

TEST_F(Rights, WithoutThePurgeEntitlementTheReplyHoldsNoDictionary) {
  EXPECT_EQ(answerTo(kClientUser, {"purge", "/volumes/tmp", "0"}), "no dictionary\n");
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "clientPurge Connection is not entitled!"))
      << sandbox_.daemonLog();
}

TEST_F(Rights, RootHoldsThePurgeEntitlement) {
  EXPECT_EQ(answerTo(0, {"purge", "/volumes/tmp", "0"}), "outcome\n");
}

TEST_F(Rights, WithoutTheServiceEntitlementACheckInGetsNoReply) {
  Process peer = sandbox_.spawn({"/programs/tests/test-peer", "check-in", "refused", "300"},
                                "refused.log", kClientUser, kClientUser);
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "clientCheckin Connection is not entitled!"));
  EXPECT_TRUE(sandbox_.waitForText("/tmp/refused.log", "without an answer"))
      << sandbox_.read("/tmp/refused.log");
  EXPECT_EQ(sandbox_.read("/tmp/refused.log").find("serving"), std::string::npos);
}

TEST_F(Rights, WithTheServiceEntitlementACheckInIsServed) {
  Process peer = sandbox_.spawn({"/programs/tests/test-peer", "check-in", "welcome", "300"},
                                "welcome.log", kServiceUser, kServiceUser);
  EXPECT_TRUE(sandbox_.waitForText("/tmp/welcome.log", "serving"))
      << sandbox_.read("/tmp/welcome.log");
}

TEST_F(Rights, TheTerminationSignalEndsTheDaemonWithStatusZeroInTheMiddleOfAPurge) {
  Process purge = sandbox_.spawn(
      {"/programs/ctl/spacekeepctl", "purge", "/volumes/tmp", "1M", "--wait-all"}, "purge.log");
  ASSERT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "waiting for 2 seconds"));
  daemon_.signal(SIGTERM);
  EXPECT_EQ(daemon_.wait(), 0);
  EXPECT_NE(purge.wait(), 0);
}

}  // namespace
}  // namespace spacekeep::system_test
