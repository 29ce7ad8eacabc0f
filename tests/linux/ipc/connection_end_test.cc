// How connections end, and that each end is told once and under its right name.
#include <gtest/gtest.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <systemd/sd-id128.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <cstddef>

#include "tests/helpers/log_capture.h"
#include "tests/helpers/threads/other_process.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

using spacekeep::test::OtherProcess;
using spacekeep::test::tellReady;

struct Ends {
  std::atomic<int> invalidations{0};
  std::atomic<int> interruptions{0};
  [[nodiscard]] int all() const { return invalidations + interruptions; }
};

std::shared_ptr<Connection> watched(IpcLoop& loop, ConcurrentQueue& global,
                                    const SharedDescriptor& descriptor, Ends& ends,
                                    ConnectionLimits limits = {}) {
  auto connection = connectionFromDescriptor(loop, global, descriptor, limits);
  connection->setRemoteInterface(testInterface());
  connection->setInvalidationHandler([&ends] { ++ends.invalidations; });
  connection->setInterruptionHandler([&ends] { ++ends.interruptions; });
  connection->resume();
  return connection;
}

SharedDescriptor connectedTo(const std::string& path) {
  std::string why;
  SharedDescriptor connected;
  EXPECT_TRUE(eventually([&] {
    connected = connectSocket(path, why);
    return connected != nullptr;
  })) << why;
  return connected;
}

TEST(ConnectionEnd, APeerThatClosesWhileItLivesIsAnInvalidation) {
  TestServer server;
  Ends ends;
  const auto connection = watched(server.loop, server.global, connectedTo(server.path()), ends);
  PendingCall pending(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  server.stop();
  const Outcome outcome = pending.wait();
  ASSERT_TRUE(outcome.error);
  EXPECT_EQ(outcome.error->name, "org.freedesktop.DBus.Error.Disconnected");
  EXPECT_TRUE(eventually([&] { return ends.all() == 1; }));
  EXPECT_EQ(ends.invalidations, 1);
  EXPECT_EQ(pending.ends(), 1U);
}

// A service that closes its connection may check in again at once, and must not find its old record.
TEST(ConnectionEnd, APeerThatClosesWhileItLivesIsToldWithoutWaitingForItsDeath) {
  TestServer server;
  Ends ends;
  ConnectionLimits limits;
  limits.peer_death_ns = 3600'000'000'000;
  const auto connection =
      watched(server.loop, server.global, connectedTo(server.path()), ends, limits);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  server.stop();
  EXPECT_TRUE(eventually([&] { return ends.invalidations == 1; }));
}

/// The work of a process that takes one connection at `path` and answers nothing.
void serveOne(const std::string& path, int ready) {
  std::string why;
  const auto listening = bindListeningSocket(path, 0600, why);
  if (listening == nullptr) ::_exit(1);
  tellReady(ready);
  sd_bus* bus = nullptr;
  int fd = -1;
  while (fd < 0) fd = ::accept(listening->fd(), nullptr, nullptr);
  sd_bus_new(&bus);
  sd_bus_set_fd(bus, fd, fd);
  sd_bus_set_server(bus, 1, sd_id128_t{{1}});
  sd_bus_start(bus);
  while (true) {
    if (sd_bus_process(bus, nullptr) < 0) ::_exit(1);
    sd_bus_wait(bus, 100'000);
  }
}

/// The same for one that never takes a connection.
void neverAccept(const std::string& path, int ready) {
  std::string why;
  const auto listening = bindListeningSocket(path, 0600, why);
  if (listening == nullptr) ::_exit(1);
  tellReady(ready);
  while (true) ::pause();
}

TEST(ConnectionEnd, APeerWhoseProcessIsKilledIsAnInterruption) {
  const spacekeep::test::TemporaryDirectory directory;
  OtherProcess service([&](int ready) { serveOne(directory / "service.sock", ready); });
  ConcurrentQueue global{{}};
  IpcLoop loop;
  Ends ends;
  {
    ConnectionLimits limits;
    limits.peer_death_ns = kLongNs;
    const auto connection =
        watched(loop, global, connectedTo(directory / "service.sock"), ends, limits);
    PendingCall pending(connection, "hold", {});
    // Its own answer shows that the process serves. It knows no such object, which is an answer.
    EXPECT_EQ(callAndWait(connection, "number", {std::int32_t{1}}).error.value().name,
              "org.freedesktop.DBus.Error.UnknownObject");
    service.end();
    EXPECT_TRUE(eventually([&] { return ends.all() == 1; }));
    EXPECT_EQ(ends.interruptions, 1);
    EXPECT_TRUE(pending.wait().error);
    EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).error);
  }
}

TEST(ConnectionEnd, APeerWhoseProcessIsKilledDuringAuthenticationIsAnInterruption) {
  const spacekeep::test::TemporaryDirectory directory;
  OtherProcess service([&](int ready) { neverAccept(directory / "service.sock", ready); });
  ConcurrentQueue global{{}};
  IpcLoop loop;
  Ends ends;
  {
    ConnectionLimits limits;
    limits.peer_death_ns = kLongNs;
    const auto connection =
        watched(loop, global, connectedTo(directory / "service.sock"), ends, limits);
    PendingCall pending(connection, "number", {std::int32_t{1}});
    service.end();
    EXPECT_TRUE(eventually([&] { return ends.all() == 1; }));
    EXPECT_EQ(ends.interruptions, 1);
    EXPECT_TRUE(pending.wait().error);
  }
}

TEST(ConnectionEnd, InvalidateFailsPendingCallsAndIsToldOnce) {
  TestServer server;
  Ends ends;
  const auto connection = watched(server.loop, server.global, connectedTo(server.path()), ends);
  PendingCall pending(connection, "hold", {});
  ASSERT_TRUE(eventually([&] { return server.held() == 1; }));
  connection->invalidate();
  connection->invalidate();
  EXPECT_TRUE(pending.wait().error);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).error);
  EXPECT_TRUE(eventually([&] { return ends.all() == 1; }));
  server.loop.runAndWait([] {});
  EXPECT_EQ(ends.invalidations, 1);
  EXPECT_EQ(ends.interruptions, 0);
  EXPECT_EQ(pending.ends(), 1U);
  // A late answer of the server goes nowhere.
  server.takeHeld().reply({std::string("late")});
  expectHonestClientIsServed(server);
  EXPECT_EQ(pending.ends(), 1U);
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
}

TEST(ConnectionEnd, InvalidateBeforeResumeFailsWhatWasHeld) {
  TestServer server;
  std::string why;
  const auto connection = connectToPath(server.loop, server.global, server.path(), why);
  connection->setRemoteInterface(testInterface());
  PendingCall held(connection, "number", {std::int32_t{1}});
  connection->invalidate();
  EXPECT_TRUE(held.wait().error);
  connection->resume();
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).error);
  EXPECT_EQ(server.served(), 0U);
}

TEST(ConnectionEnd, DroppingItClosesItWithoutRunningAHandler) {
  TestServer server;
  Ends ends;
  auto connection = watched(server.loop, server.global, connectedTo(server.path()), ends);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  EXPECT_EQ(server.server().connections(), 1U);
  connection.reset();
  EXPECT_TRUE(eventually([&] { return server.server().connections() == 0; }));
  EXPECT_EQ(ends.all(), 0);
}

TEST(ConnectionEnd, AnUnusableDescriptorGivesAConnectionWhoseCallsFail) {
  ConcurrentQueue global{{}};
  IpcLoop loop;
  Ends ends;
  for (const SharedDescriptor& bad :
       {SharedDescriptor(), std::make_shared<Descriptor>(::dup(STDIN_FILENO)),
        makeSocketPair().first}) {
    ends.invalidations = 0;
    const auto connection = watched(loop, global, bad, ends);
    EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).error);
    EXPECT_TRUE(eventually([&] { return ends.invalidations == 1; }));
  }
  EXPECT_EQ(ends.interruptions, 0);
}

TEST(ConnectionEnd, APeerThatNeverAuthenticatesIsGivenUp) {
  ConcurrentQueue global{{}};
  IpcLoop loop;
  Ends ends;
  const SocketPair pair = makeSocketPair();
  ConnectionLimits limits;
  limits.authentication_ns = 50'000'000;
  const auto connection = watched(loop, global, pair.first, ends, limits);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).error);
  EXPECT_TRUE(eventually([&] { return ends.invalidations == 1; }));
}

TEST(ConnectionEnd, OfASocketPairIsToldToTheOtherSideThoughBothEndsAreKept) {
  TestServer server;
  Ends ends;
  const SocketPair pair = makeSocketPair();
  std::atomic<int> served_ends = 0;
  server.server().serveConnected(pair.first, [&served_ends] { ++served_ends; });
  auto connection = watched(server.loop, server.global, pair.second, ends);
  EXPECT_TRUE(callAndWait(connection, "number", {std::int32_t{1}}).reply);
  connection->invalidate();
  EXPECT_TRUE(eventually([&] { return ends.invalidations == 1; }));
  EXPECT_TRUE(eventually([&] { return served_ends == 1; }));
  EXPECT_EQ(server.server().connections(), 0U);
}

// Who is cut off shall know it at once, since it has to check in again.
TEST(ConnectionEnd, ThatALimitBringsIsSeenByThePeerThoughTheDescriptorIsKept) {
  ConcurrentQueue global{{}};
  IpcLoop loop;
  Ends ends;
  const SocketPair pair = makeSocketPair();
  ConnectionLimits limits;
  limits.authentication_ns = 50'000'000;
  const auto connection = watched(loop, global, pair.first, ends, limits);
  EXPECT_TRUE(eventually([&] {
    pollfd state = {pair.second->fd(), 0, 0};
    return ::poll(&state, 1, 0) == 1 && (state.revents & POLLHUP) != 0;
  }));
}

/// Makes the kernel answer the thread that has no room for what it wants to send.
bool takeBuffersFromThisThread() {
  std::array<sock_filter, 4> steps = {{
      BPF_STMT(BPF_LD | BPF_W | BPF_ABS, offsetof(seccomp_data, nr)),
      BPF_JUMP(BPF_JMP | BPF_JEQ | BPF_K, SYS_sendmsg, 0, 1),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ERRNO | ENOBUFS),
      BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW),
  }};
  const sock_fprog program{steps.size(), steps.data()};
  return ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0 &&
         ::prctl(PR_SET_SECCOMP, SECCOMP_MODE_FILTER, &program) == 0;
}

class ShortOfBuffers : public ::testing::Test {
 protected:
  void SetUp() override {
    sd_bus_message* call = client.newCall("hold");
    std::uint64_t serial = 0;  // without it no answer is asked for
    ASSERT_GE(sd_bus_send(client.bus(), call, &serial), 0);
    sd_bus_message_unref(call);
    ASSERT_GE(sd_bus_flush(client.bus()), 0);
    ASSERT_TRUE(eventually([this] { return server.held() == 1; }));
  }
  void takeBuffers() {
    server.loop.runAndWait([] { ASSERT_TRUE(takeBuffersFromThisThread()); });
  }
  void expectEndWithLine() {
    EXPECT_TRUE(eventually([this] { return server.server().connections() == 0; }));
    EXPECT_EQ(
        log.count(kLogProblem, "messages for it cannot be written: No buffer space available"), 1U);
  }

  const spacekeep::test::LogCapture log;
  TestServer server;
  BareClient client{server.path()};
};

TEST_F(ShortOfBuffers, AnAnswerThatCannotBeWrittenEndsTheConnectionWithALine) {
  takeBuffers();
  server.takeHeld().reply({std::string("text")});
  expectEndWithLine();
}

TEST_F(ShortOfBuffers, AnAnswerWhoseRestCannotBeWrittenEndsTheConnectionWithALine) {
  server.takeHeld().reply({std::string(900'000, 'x')});
  server.loop.runAndWait([] {});
  takeBuffers();
  // Reading makes room for it.
  ASSERT_TRUE(eventually([this] { return sd_bus_process(client.bus(), nullptr) < 0; }));
  expectEndWithLine();
}

}  // namespace
}  // namespace spacekeep::ipc::test
