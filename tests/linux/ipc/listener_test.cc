// The daemon's listener: only peers that hold the required entitlement get in.
#include <gtest/gtest.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <string>
#include <utility>
#include <vector>

#include "support/access/access.h"
#include "support/access/peer_identity.h"
#include "support/ipc/linux/bus_listener.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

class OneRight : public Access {
 public:
  bool connectionIsEntitled(PeerConnection* connection,
                            std::initializer_list<std::string_view> entitlements) override {
    if (connection == nullptr) return false;
    for (const std::string_view entitlement : entitlements) {
      if (entitlement != "HELD") return false;
    }
    return true;
  }
};

ServedInterface pingInterface() {
  static const InterfaceDescription description = {"com.quorvel.IpcTest", {{"number", {}, {}}}};
  ServedInterface served;
  served.description = &description;
  ServedMethod method;
  method.name = "number";
  method.serve = [](const Arguments&, const Responder& responder) { responder.reply({}); };
  served.methods.push_back(std::move(method));
  return served;
}

class ListenerTest : public ::testing::Test {
 protected:
  spacekeep::test::TemporaryDirectory directory;
  ConcurrentQueue global{{}};
  IpcLoop loop;
  OneRight access;
  std::string why;
  ServerOptions options;
  SharedDescriptor listening = bindListeningSocket(directory / "s", 0600, why);
};

TEST_F(ListenerTest, RefusesPeersWithoutTheRequiredEntitlement) {
  spacekeep::test::LogCapture log;
  BusListener listener(loop, global, access, listening, pingInterface());
  listener.setRequiredEntitlement("MISSING");
  listener.resume();
  RawPeer peer(directory / "s");
  EXPECT_TRUE(peer.isCutOff());
  EXPECT_EQ(log.count(kLogProblem, "it does not hold \"MISSING\""), 1U);
  EXPECT_EQ(log.count(kLogProblem, "uid " + std::to_string(::geteuid())), 1U);
}

TEST_F(ListenerTest, ServesPeersThatHoldIt) {
  BusListener listener(loop, global, access, listening, pingInterface());
  listener.setRequiredEntitlement("HELD");
  listener.resume();
  BareClient client(directory / "s");
  EXPECT_EQ(client.errorOf(client.newCall("number")), "");
  EXPECT_EQ(listener.connections(), 1U);
}

TEST_F(ListenerTest, AcceptsNobodyBeforeItIsResumed) {
  BusListener listener(loop, global, access, listening, pingInterface());
  BareClient client(directory / "s");
  loop.runAndWait([] {});
  EXPECT_EQ(listener.connections(), 0U);
  listener.resume();
  EXPECT_EQ(client.errorOf(client.newCall("number")), "");
}

TEST_F(ListenerTest, PausesWhenDescriptorsAreUsedUpAndGoesOnAfterwards) {
  spacekeep::test::LogCapture log;
  options.limits.accept_pause_ns = 50'000'000;
  BusListener listener(loop, global, access, listening, pingInterface(), options);
  listener.resume();
  RawPeer waiting(directory / "s");
  ASSERT_TRUE(eventually([&] { return listener.connections() == 1; }));
  rlimit before{};
  ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
  // From here on only what is open already can be used: one socket for the next client, none for
  // the listener.
  const SharedDescriptor next = connectSocket(directory / "s", why);
  ASSERT_NE(next, nullptr);
  ASSERT_TRUE(eventually([&] { return listener.connections() == 2; }));
  loop.runAndWait([] {});  // what was open only while that one was accepted is closed
  const int lowest = ::dup(next->fd());
  ::close(lowest);
  const SharedDescriptor spare = std::make_shared<Descriptor>(::socket(AF_UNIX, SOCK_STREAM, 0));
  rlimit none = before;
  none.rlim_cur = static_cast<rlim_t>(lowest) + 1;
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string path = directory / "s";
  path.copy(address.sun_path, sizeof address.sun_path - 1);
  EXPECT_EQ(::connect(spare->fd(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  EXPECT_TRUE(eventually([&] { return log.count(kLogProblem, "Accepting pauses") > 0; }));
  EXPECT_TRUE(eventually([&] { return wakeUpsInNs(loop, 200'000'000) <= 20; }));
  ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
  EXPECT_TRUE(eventually([&] { return listener.connections() == 3; }));
}

TEST(BusServer, AnAdmittedPeerIsServedWhateverTheAdmissionWrote) {
  ServerOptions options = TestServer::defaultOptions();
  options.admit = [](PeerConnection&, std::string& why) {
    why = "a remark, not a refusal";
    return true;
  };
  TestServer server(std::move(options));
  expectHonestClientIsServed(server);
}

}  // namespace
}  // namespace spacekeep::ipc::test
