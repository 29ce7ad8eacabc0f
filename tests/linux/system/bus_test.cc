// The real daemon on a system bus: called by other people's programs, under several users.
#include <gtest/gtest.h>

#include <csignal>
#include <filesystem>
#include <string>
#include <vector>

#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

// Accounts that every machine has, since dbus-daemon lets in nobody else.
constexpr uid_t kClientUser = 5;  // may connect and ask how much could be freed
constexpr uid_t kStranger = 1;    // no rule names it

constexpr const char* kConfiguration =
    R"(<busconfig><type>system</type><listen>unix:path=/run/dbus/system_bus_socket</listen>
    <auth>EXTERNAL</auth>
    <policy context="default"><allow user="*"/><deny own="*"/><deny send_type="method_call"/>
    <allow send_type="signal"/><allow send_requested_reply="true" send_type="method_return"/>
    <allow send_requested_reply="true" send_type="error"/>
    <allow receive_type="method_call"/><allow receive_type="method_return"/>
    <allow receive_type="error"/><allow receive_type="signal"/>
    <allow send_destination="org.freedesktop.DBus"/></policy>
    <include>/source/packaging/dbus/com.quorvel.Spacekeep.conf</include></busconfig>)";

constexpr const char* kRule =
    R"(<plist version="1.0"><dict><key>MATCH_USER</key><integer>5</integer>
    <key>GRANT</key><array><string>CLIENT_ENTITLEMENT</string>
    <string>PURGEABLE_ENTITLEMENT</string></array></dict></plist>)";

/// The first block of code in that language.
std::string exampleIn(const std::string& document, const std::string& language) {
  const std::string begin = "```" + language + "\n";
  const std::size_t from = document.find(begin);
  if (from == std::string::npos) return "";
  const std::size_t start = from + begin.size();
  return document.substr(start, document.find("```", start) - start);
}

class OnTheBus : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("tmp", "tmpfs", 16);
    sandbox_.start();
    sandbox_.write("/etc/spacekeep/entitlements.d/clients.plist", kRule);
    sandbox_.write("/tmp/bus.conf", kConfiguration);
    startBus();
    daemon_ = sandbox_.startDaemon();
    ASSERT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "serves as com.quorvel.Spacekeep"))
        << sandbox_.daemonLog();
  }

  void startBus() {
    std::filesystem::create_directories(sandbox_.outside("/run/dbus"));
    std::filesystem::remove(sandbox_.outside("/run/dbus/system_bus_socket"));
    std::filesystem::remove(sandbox_.outside("/tmp/bus.log"));
    bus_ = sandbox_.spawn({"dbus-daemon", "--nofork", "--nopidfile", "--nosyslog",
                           "--print-address=1", "--config-file=/tmp/bus.conf"},
                          "bus.log");
    ASSERT_TRUE(sandbox_.waitForText("/tmp/bus.log", "unix:path="))
        << sandbox_.read("/tmp/bus.log");
  }

  std::string answerTo(uid_t user, const std::vector<std::string>& command) {
    static int count = 0;
    const std::string log = "caller-" + std::to_string(++count) + ".log";
    std::vector<std::string> whole = {
        "env", "DBUS_SYSTEM_BUS_ADDRESS=unix:path=/run/dbus/system_bus_socket"};
    whole.insert(whole.end(), command.begin(), command.end());
    sandbox_.spawn(whole, log, user, user).wait();
    return sandbox_.read("/tmp/" + log);
  }

  /// busctl's call of a method that takes a request about the volume.
  std::string call(uid_t user, const std::string& method, const std::string& volume) {
    return answerTo(user, {"busctl", "call", "com.quorvel.Spacekeep", "/com/quorvel/Spacekeep",
                           "com.quorvel.SpacekeepClientProtocol", method, "a{sv}", "1",
                           "SPACEKEEP_VOLUME", "s", volume});
  }

  Sandbox sandbox_;
  Process bus_;
  Process daemon_;
};

TEST_F(OnTheBus, AQueryIsAnswered) {
  const std::string answer = call(0, "clientPurgeableSpace", "/volumes/tmp");
  EXPECT_EQ(answer.find("aa{sv} 1 "), 0U) << answer;
  EXPECT_NE(answer.find("\"SPACEKEEP_TOTAL_AVAILABLE\""), std::string::npos) << answer;
}

TEST_F(OnTheBus, ARequestThatTheDaemonRefusesIsAnsweredWithNoDictionary) {
  EXPECT_EQ(call(0, "clientPurgeableSpace", "/nowhere"), "aa{sv} 0\n");
}

TEST_F(OnTheBus, RightsAreThoseOfTheUserWhoCalls) {
  EXPECT_EQ(call(kClientUser, "clientPurgeableSpace", "/volumes/tmp").find("aa{sv} 1 "), 0U);
  EXPECT_EQ(call(kClientUser, "clientPurge", "/volumes/tmp"), "aa{sv} 0\n");
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "clientPurge Connection is not entitled!"));
  // Whatever the daemon says, busctl puts it so.
  EXPECT_EQ(call(kStranger, "clientPurgeableSpace", "/volumes/tmp"),
            "Call failed: Access denied\n");
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "it does not hold \"CLIENT_ENTITLEMENT\""));
}

TEST_F(OnTheBus, StateThatIsSetOnTheBusIsReadOnTheSocket) {
  const std::vector<std::string> object = {"busctl", "call", "com.quorvel.Spacekeep",
                                           "/com/quorvel/Spacekeep",
                                           "com.quorvel.SpacekeepClientProtocol"};
  auto set = object;
  set.insert(set.end(), {"clientSetState", "avs", "1", "s", "blue", "COLOUR"});
  EXPECT_EQ(answerTo(0, set), "");
  auto get = object;
  get.insert(get.end(), {"clientGetState", "s", "COLOUR"});
  EXPECT_EQ(answerTo(0, get), "av 1 s \"blue\"\n");
  EXPECT_NE(
      sandbox_.run({"/programs/ctl/spacekeepctl", "state", "get", "COLOUR"}).text.find("blue"),
      std::string::npos);
}

TEST_F(OnTheBus, ThePythonExampleRunsAsItStandsInTheDocumentation) {
  const std::string example = exampleIn(sandbox_.read("/source/docs/bus.md"), "python");
  ASSERT_NE(example.find("import dbus"), std::string::npos);
  sandbox_.write("/tmp/example.py", example);
  const std::string answer = answerTo(0, {"/usr/bin/python3", "/tmp/example.py"});
  EXPECT_EQ(answer, "0\n");
}

TEST_F(OnTheBus, ACheckInIsSentToTheSocket) {
  sandbox_.write(
      "/tmp/check_in.py",
      "import dbus, os\n"
      "daemon = dbus.SystemBus().get_object('com.quorvel.Spacekeep',\n"
      "    '/com/quorvel/Spacekeep', introspect=False)\n"
      "try:\n"
      "    daemon.clientCheckin('id', dbus.types.UnixFd(0),\n"
      "        dbus.Dictionary({}, signature='sv'),\n"
      "        dbus_interface='com.quorvel.SpacekeepClientProtocol', signature='sha{sv}')\n"
      "except dbus.DBusException as error:\n"
      "    print(error)\n");
  EXPECT_EQ(answerTo(0, {"/usr/bin/python3", "/tmp/check_in.py"}),
            "org.freedesktop.DBus.Error.NotSupported: Descriptors are not taken over the bus; "
            "connect to the daemon's socket instead, /run/spacekeep/spacekeep.sock\n");
}

TEST_F(OnTheBus, TheDaemonComesBackToABusThatWasRestarted) {
  bus_ = Process();
  ASSERT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "the peer has left"));
  startBus();
  std::string answer;
  for (int i = 0; i < 300 && answer.find("aa{sv} 1 ") != 0; ++i) {
    answer = call(0, "clientPurgeableSpace", "/volumes/tmp");
  }
  EXPECT_EQ(answer.find("aa{sv} 1 "), 0U) << answer;
}

TEST_F(OnTheBus, ADaemonThatIsKilledLeavesItsNameToTheNextOne) {
  daemon_.signal(SIGKILL);
  daemon_.wait();
  daemon_ = sandbox_.startDaemon();
  ASSERT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "serves as com.quorvel.Spacekeep"));
  EXPECT_EQ(call(0, "clientPurgeableSpace", "/volumes/tmp").find("aa{sv} 1 "), 0U);
}

}  // namespace
}  // namespace spacekeep::system_test
