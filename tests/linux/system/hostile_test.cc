// Peers that do harm, on purpose or not. Beside each of them an honest client's purge succeeds, the
// daemon stays up and small, and its log says what was refused.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <spacekeep/client.h>
#include <spacekeep/service.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

#include "support/runtime/runtime.h"
#include "tests/linux/system/raw_peer.h"
#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

constexpr std::uint64_t kFileBytes = 64 * 1024;

class Hoard : public sdk::Service {
 public:
  explicit Hoard(std::string directory) : directory_(std::move(directory)) {}
  sdk::Answer purge(const sdk::Job&) override {
    const std::string path = directory_ + "/hoard";
    if (!std::filesystem::remove(path)) return {};
    return {.amount = kFileBytes, .more = {}};
  }
  void grow() const { std::ofstream(directory_ + "/hoard") << std::string(kFileBytes, 'x'); }

 private:
  std::string directory_;
};

class Hostile : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("tmp", "tmpfs", 16);
    sandbox_.start();
    daemon_ = sandbox_.startDaemon();
    hoard_ = std::make_shared<Hoard>(sandbox_.volume("tmp"));
    sdk::CheckInOptions options;
    options.socket_path = sandbox_.socketPath();
    auto host = sdk::ServiceHost::checkIn("hoard", hoard_, options);
    ASSERT_TRUE(host);
    host_ = std::make_unique<sdk::ServiceHost>(std::move(*host));
    ASSERT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "ping got pong"));
    honest_ = std::make_unique<sdk::Client>(connect());
  }

  void TearDown() override {
    EXPECT_TRUE(daemon_.running());
    EXPECT_LT(residentKib(), 64 * 1024);
  }

  sdk::Client connect() {
    auto client = sdk::Client::connect({.socket_path = sandbox_.socketPath(), .on_disconnect = {}});
    if (!client) throw std::runtime_error(client.error().text);
    return std::move(*client);
  }

  void expectHonestPurgeSucceeds() {
    hoard_->grow();
    const sdk::Reply reply = honest_->purge({.volume = "/volumes/tmp",
                                             .amount = kFileBytes,
                                             .urgency = 1,
                                             .timeout_seconds = 10,
                                             .token = {},
                                             .finish_early = true});
    ASSERT_TRUE(reply.outcome) << (reply.error ? reply.error->text : "refused");
    EXPECT_GE(unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value_or(0), kFileBytes);
  }

  [[nodiscard]] long residentKib() const {
    std::ifstream status("/proc/" + std::to_string(daemon_.pid()) + "/status");
    for (std::string word; status >> word;) {
      if (word != "VmHWM:") continue;
      status >> word;
      return std::stol(word);
    }
    return -1;
  }

  [[nodiscard]] RawPeer peer() const { return RawPeer(sandbox_.socketPath()); }
  [[nodiscard]] RawPeer authenticatedPeer() const {
    RawPeer peer(sandbox_.socketPath());
    peer.authenticate();
    return peer;
  }

  Sandbox sandbox_;
  Process daemon_;
  std::shared_ptr<Hoard> hoard_;
  std::unique_ptr<sdk::ServiceHost> host_;
  std::unique_ptr<sdk::Client> honest_;
};

TEST_F(Hostile, GarbageInsteadOfAuthenticationIsClosed) {
  const RawPeer garbage = peer();
  garbage.send("GET / HTTP/1.1\r\nHost: disk\r\n\r\n" + std::string(100'000, '\xff'));
  expectHonestPurgeSucceeds();
  EXPECT_TRUE(garbage.closedByPeer());
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "refused")) << sandbox_.daemonLog();
}

TEST_F(Hostile, HalfAnAuthenticationLeftOpenIsClosedByItsTimeLimit) {
  const RawPeer half = peer();
  half.send(std::string_view("\0AUTH EXTER", 11));
  expectHonestPurgeSucceeds();
  EXPECT_TRUE(half.closedByPeer());
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "did not authenticate in time"))
      << sandbox_.daemonLog();
}

TEST_F(Hostile, AnOversizedMessageIsRefusedBeforeItIsRead) {
  const RawPeer large = authenticatedPeer();
  large.send(callClaiming("clientPurge", "a{sv}", 100U * 1024 * 1024));
  large.send(std::string(8 * 1024 * 1024, 'x'));
  expectHonestPurgeSucceeds();
  EXPECT_TRUE(large.closedByPeer());
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "it sent a message of 10485"))
      << sandbox_.daemonLog();
}

TEST_F(Hostile, DeeplyNestedMessagesAreRefused) {
  for (const int depth : {40, 60, 100, 200}) {
    const RawPeer deep = authenticatedPeer();
    deep.send(methodCall("clientCancelPurge", "a{sv}", nestedVariants(depth)));
    const std::string answer = deep.receive();
    EXPECT_TRUE(answer.find("org.freedesktop.DBus.Error.") != std::string::npos ||
                (answer.empty() && deep.closedByPeer()))
        << depth;
  }
  expectHonestPurgeSucceeds();
}

TEST_F(Hostile, NestingWithinTheLimitIsServed) {
  const RawPeer nested = authenticatedPeer();
  nested.send(methodCall("clientCancelPurge", "a{sv}", nestedVariants(20)));
  const std::string answer = nested.receive();
  EXPECT_FALSE(answer.empty());
  EXPECT_EQ(answer.find("org.freedesktop.DBus.Error."), std::string::npos);
}

TEST_F(Hostile, WrongTypesForEveryArgumentOfEveryOperationGetAnError) {
  const std::vector<std::string> members = {
      "clientCheckin", "clientPurgeableSpace", "clientItemizedPurgeableSpace",
      "clientPurge",   "clientCancelPurge",    "clientSetState",
      "clientGetState"};
  const std::string number("\x2a\0\0\0\0\0\0\0", 8);
  for (const std::string& member : members) {
    for (const std::string signature : {"", "u", "t", "x", "d", "ai", "as", "a{ss}", "(u)", "v"}) {
      const RawPeer wrong = authenticatedPeer();
      wrong.send(methodCall(member, signature,
                            signature.empty() ? std::string() : std::string(8, '\0') + number));
      static_cast<void>(wrong.receive());
    }
    // The same in the right number of arguments, each a number.
    const RawPeer wrong = authenticatedPeer();
    wrong.send(methodCall(member, "u", number.substr(0, 4)));
    EXPECT_NE(wrong.receive().find("org.freedesktop.DBus.Error.InvalidArgs"), std::string::npos)
        << member;
  }
  expectHonestPurgeSucceeds();
}

TEST_F(Hostile, AForgedSenderChangesNothing) {
  const RawPeer forger = authenticatedPeer();
  std::string empty_dictionary(8, '\0');
  forger.send(methodCall("clientCancelPurge", "a{sv}", empty_dictionary, "org.freedesktop.DBus"));
  EXPECT_FALSE(forger.receive().empty());
  expectHonestPurgeSucceeds();
}

TEST_F(Hostile, APeerThatNeverReadsIsCutOff) {
  const RawPeer deaf = authenticatedPeer();
  const std::string call = methodCall("clientGetState", "u", std::string(4, '\0'));
  std::string burst;
  for (int i = 0; i < 1000; ++i) burst += call;
  std::size_t sent = 0;
  for (int i = 0; i < 60; ++i) sent += deaf.send(burst);
  EXPECT_GT(sent, 0U);
  expectHonestPurgeSucceeds();
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "bytes unread")) << sandbox_.daemonLog();
  EXPECT_TRUE(deaf.closedByPeer());
}

TEST_F(Hostile, AThousandConnectionsOfOneUserLeaveRoomForOthers) {
  rlimit files = {};
  getrlimit(RLIMIT_NOFILE, &files);
  files.rlim_cur = files.rlim_max;
  setrlimit(RLIMIT_NOFILE, &files);
  std::vector<RawPeer> crowd;
  for (int i = 0; i < 1000; ++i) crowd.push_back(authenticatedPeer());
  expectHonestPurgeSucceeds();
  EXPECT_TRUE(sandbox_.waitForText("/tmp/daemon.log", "connections of this user are open"))
      << sandbox_.daemonLog();
  crowd.clear();
  EXPECT_NO_THROW(static_cast<void>(connect()));
}

}  // namespace
}  // namespace spacekeep::system_test
