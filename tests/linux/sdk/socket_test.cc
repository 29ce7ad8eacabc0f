#include <fcntl.h>
#include <gmock/gmock.h>
#include <grp.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spacekeep/service.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <memory>
#include <string>

#include "sdk/daemon_account.h"
#include "sdk/socket_loop.h"
#include "tests/linux/sdk/fake_daemon.h"
#include "tests/linux/sdk/test_service.h"

namespace spacekeep::sdk {
namespace {

using std::chrono::milliseconds;
using testing::HasSubstr;

class SocketTest : public testing::Test {
 protected:
  ipc::SharedDescriptor listen() {
    std::string why;
    auto listening = ipc::bindListeningSocket(directory_.serviceSocket(), 0666, why);
    EXPECT_NE(listening, nullptr) << why;
    return listening;
  }
  /// The bytes that a purge through the service's socket answers, none when it is not answered.
  std::optional<std::uint64_t> purgeThroughSocket(std::uint64_t amount) {
    std::string why;
    auto connection =
        ipc::connectToPath(daemon_.loop, daemon_.queue, directory_.serviceSocket(), why);
    if (!connection) return std::nullopt;
    struct Slot {
      CountingSemaphore filled{0};
      std::optional<std::uint64_t> bytes;
    };
    const auto slot = std::make_shared<Slot>();
    connection->setRemoteInterface(spacekeepServiceInterface());
    connection->resume();
    const SpacekeepServiceProtocol service(
        connection->remoteProxy([slot](const ipc::Error&) { slot->filled.signal(); }));
    service.servicePurge(1, {{"SPACEKEEP_AMOUNT", amount}},
                         [slot](const ipc::OptionalDictionary& reply) {
                           slot->bytes = unsignedAt(*reply, "SPACEKEEP_AMOUNT");
                           slot->filled.signal();
                         });
    EXPECT_EQ(slot->filled.waitForNs(20'000'000'000), WaitResult::kSignalled);
    connection->invalidate();
    return slot->bytes;
  }

  SocketDirectory directory_;
  FakeDaemon daemon_{directory_.daemonSocket()};
};

TEST_F(SocketTest, ServesEveryConnectionAtAGivenSocketUntilItIsStopped) {
  SocketOptions options;
  options.listening_fd = dup(listen()->fd());
  auto host = ServiceHost::serveSocket(std::make_shared<TestService>(), options);
  ASSERT_TRUE(host) << host.error().text;
  ASSERT_TRUE(eventually([&] { return host->status().state == HostState::kServing; }));
  EXPECT_EQ(purgeThroughSocket(7), 7U);
  EXPECT_EQ(purgeThroughSocket(8), 8U);
  host->stop();
  host->waitUntilStopped();
  EXPECT_EQ(host->status().state, HostState::kStopped);
}

TEST_F(SocketTest, StopsByItselfWhenNothingIsAskedButNotWhileAPurgeRuns) {
  const auto listening = listen();
  const auto service = std::make_shared<TestService>();
  service->holding = true;
  std::optional<ServiceHost> host;
  std::shared_ptr<ipc::Connection> connection;
  std::optional<SpacekeepServiceProtocol> proxy;
  const auto answered = std::make_shared<std::atomic<bool>>(false);
  // The machine may hold the caller up for longer than the host waits for a call. Then the host is
  // right to stop, and the next one is asked.
  for (int attempt = 0; attempt < 20 && service->inside == 0; ++attempt) {
    if (connection) connection->invalidate();
    SocketOptions options;
    options.listening_fd = dup(listening->fd());
    options.stop_when_idle = milliseconds(50);
    auto started = ServiceHost::serveSocket(service, options);
    ASSERT_TRUE(started);
    host.emplace(std::move(*started));
    std::string why;
    connection = ipc::connectToPath(daemon_.loop, daemon_.queue, directory_.serviceSocket(), why);
    ASSERT_NE(connection, nullptr) << why;
    connection->setRemoteInterface(spacekeepServiceInterface());
    connection->resume();
    proxy.emplace(connection->remoteProxy([](const ipc::Error&) {}));
    proxy->servicePurge(1, {}, [answered](const ipc::OptionalDictionary&) { *answered = true; });
    ASSERT_TRUE(eventually(
        [&] { return service->inside == 1 || host->status().state == HostState::kStopped; }));
  }
  ASSERT_EQ(service->inside, 1);
  rt::sleepNs(300'000'000);  // several times the idle time, in which the host must not stop
  EXPECT_EQ(host->status().state, HostState::kServing);
  proxy->serviceCancelPurge([] {});
  EXPECT_TRUE(eventually([&] { return answered->load(); }));
  host->waitUntilStopped();
  EXPECT_EQ(host->status().state, HostState::kStopped);
  connection->invalidate();
}

/// A connection of which the other side has answered the first words; -1 when there is none.
int admittedConnection(const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size());
  const int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  // A host that has just ended leaves the connection in the backlog.
  const timeval patience{.tv_sec = 1, .tv_usec = 0};
  setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  const char begin_of_authentication[] = "\0AUTH EXTERNAL\r\n";
  char byte = 0;
  if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0 &&
      send(fd, begin_of_authentication, sizeof begin_of_authentication - 1, MSG_NOSIGNAL) > 0 &&
      recv(fd, &byte, 1, 0) == 1) {
    return fd;
  }
  close(fd);
  return -1;
}

TEST_F(SocketTest, AConnectionThatHasNotAskedYetKeepsTheHostForAFullIdleTime) {
  using Clock = std::chrono::steady_clock;
  constexpr milliseconds kIdle(300);
  const auto listening = listen();
  // Counts only when the host's first idle time was not over yet; the machine may hold this up.
  for (int attempt = 0; attempt < 100; ++attempt) {
    SocketOptions options;
    options.listening_fd = dup(listening->fd());
    options.stop_when_idle = kIdle;
    const auto started = Clock::now();
    auto host = ServiceHost::serveSocket(std::make_shared<TestService>(), options);
    ASSERT_TRUE(host) << host.error().text;
    rt::sleepNs(150'000'000);  // half of it
    const auto connecting = Clock::now();
    const int fd = admittedConnection(directory_.serviceSocket());
    const bool counts = fd >= 0 && Clock::now() - started < kIdle;
    host->waitUntilStopped();
    const auto lived_on = Clock::now() - connecting;
    if (fd >= 0) close(fd);
    if (!counts) continue;
    EXPECT_GE(lived_on, kIdle);
    return;
  }
  FAIL() << "the machine held up every attempt";
}

TEST_F(SocketTest, WhatIsNoListeningUnixSocketIsAnErrorThatNamesTheDescriptor) {
  int pipe_ends[2];
  ASSERT_EQ(pipe(pipe_ends), 0);
  const int unbound = socket(AF_UNIX, SOCK_STREAM, 0);
  for (const int fd : {pipe_ends[0], unbound, -1}) {
    SocketOptions options;
    options.listening_fd = fd;
    const auto host = ServiceHost::serveSocket(std::make_shared<Service>(), options);
    ASSERT_FALSE(host) << fd;
    EXPECT_EQ(host.error().kind, ErrorKind::kInvalidArgument);
    EXPECT_THAT(host.error().text, HasSubstr("descriptor " + std::to_string(fd)));
  }
  for (const int fd : {pipe_ends[0], pipe_ends[1], unbound}) close(fd);
}

TEST_F(SocketTest, WithoutASocketFromTheServiceManagerTheErrorSaysWhatToDo) {
  unsetenv("LISTEN_PID");
  unsetenv("LISTEN_FDS");
  const auto host = ServiceHost::serveSocket(std::make_shared<Service>());
  ASSERT_FALSE(host);
  EXPECT_THAT(host.error().text, HasSubstr("LISTEN_FDS"));
}

/// Starts `socket-service` with `listening` as descriptor 3 and its output in a pipe. Only what may
/// be called between fork and exec happens in the child.
pid_t startActivated(int listening, int output, const char* idle_ms) {
  const std::string program = std::string(SPACEKEEP_BUILD_DIR) + "/tests/socket-service";
  // exec keeps the process number, so the shell can name its own.
  const std::string script = "LISTEN_PID=$$ LISTEN_FDS=1 exec \"$0\" \"$1\"";
  char* arguments[] = {const_cast<char*>("sh"),  // NOLINT: execv does not write to them
                       const_cast<char*>("-c"),
                       const_cast<char*>(script.c_str()),
                       const_cast<char*>(program.c_str()),
                       const_cast<char*>(idle_ms),
                       nullptr};
  const pid_t child = fork();
  if (child != 0) return child;
  if (dup2(output, 1) < 0 || dup2(listening, 3) < 0) _exit(126);
  fcntl(3, F_SETFD, 0);
  execv("/bin/sh", arguments);
  _exit(127);
}

TEST_F(SocketTest, AProcessStartedWithAHandedOverSocketServesAtItAndEndsWhenIdle) {
  const auto listening = listen();
  int output[2];
  ASSERT_EQ(pipe2(output, O_CLOEXEC), 0);
  // Longer than the machine may hold up the call: a process that is idle is right to end.
  const pid_t child = startActivated(listening->fd(), output[1], "3000");
  ASSERT_GT(child, 0);
  close(output[1]);
  EXPECT_EQ(purgeThroughSocket(99), 99U);  // the connection waited in the backlog for the process
  int status = 0;
  ASSERT_EQ(waitpid(child, &status, 0), child);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  char text[200] = {};
  EXPECT_GT(read(output[0], text, sizeof text - 1), 0);
  EXPECT_STREQ(text, "stopped\n");
  close(output[0]);
}

/// Who is at the other end of a new connection, as the kernel tells it.
pid_t whoServes(const std::string& path) {
  std::string why;
  const auto connected = ipc::connectSocket(path, why);
  EXPECT_NE(connected, nullptr) << why;
  ucred peer = {};
  socklen_t size = sizeof peer;
  EXPECT_EQ(getsockopt(connected->fd(), SOL_SOCKET, SO_PEERCRED, &peer, &size), 0);
  return peer.pid;
}

TEST_F(SocketTest, WhoConnectsIsToldTheProcessThatServesAndNotTheOneThatMadeTheSocket) {
  const auto listening = listen();
  EXPECT_EQ(whoServes(directory_.serviceSocket()), getpid());
  int output[2];
  ASSERT_EQ(pipe2(output, O_CLOEXEC), 0);
  const pid_t child = startActivated(listening->fd(), output[1], "60000");
  ASSERT_GT(child, 0);
  EXPECT_EQ(purgeThroughSocket(99), 99U);
  EXPECT_EQ(whoServes(directory_.serviceSocket()), child);
  kill(child, SIGKILL);
  ASSERT_EQ(waitpid(child, nullptr, 0), child);
  close(output[0]);
  close(output[1]);
}

TEST_F(SocketTest, WhoConnectsToAGivenSocketIsToldTheProcessThatServes) {
  const auto listening = listen();
  const pid_t before = fork();
  if (before == 0) _exit(::listen(listening->fd(), 1));
  ASSERT_EQ(waitpid(before, nullptr, 0), before);
  EXPECT_EQ(whoServes(directory_.serviceSocket()), before);
  SocketOptions options;
  options.listening_fd = dup(listening->fd());
  auto host = ServiceHost::serveSocket(std::make_shared<TestService>(), options);
  ASSERT_TRUE(host) << host.error().text;
  EXPECT_EQ(whoServes(directory_.serviceSocket()), getpid());
}

struct PeerCase {
  uid_t peer, own;
  std::optional<uid_t> allowed;
  bool admitted;
};

TEST(SocketAdmission, RootTheOwnUserAndTheAllowedOneMayCallAndNobodyElse) {
  const PeerCase cases[] = {
      {0, 1000, std::nullopt, true},     {1000, 1000, std::nullopt, true},
      {1001, 1000, std::nullopt, false}, {1001, 1000, 1001, true},
      {1002, 1000, 1001, false},         {UINT32_MAX, 1000, std::nullopt, false},
      {1000, 0, std::nullopt, false},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(mayCall(c.peer, c.own, c.allowed), c.admitted) << c.peer << ' ' << c.own;
  }
}

/// Connects as another user and reads: 0 when the other side closed, 1 when bytes or time came, 2
/// when there was no connection.
int readAsUser(uid_t user, const std::string& path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.c_str(), path.size());
  const pid_t child = fork();
  if (child == 0) {
    if (setgroups(0, nullptr) != 0 || setgid(user) != 0 || setuid(user) != 0) _exit(3);
    const int fd = socket(AF_UNIX, SOCK_STREAM, 0);
    if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) _exit(2);
    const char begin_of_authentication[] = "\0AUTH EXTERNAL\r\n";
    (void)send(fd, begin_of_authentication, sizeof begin_of_authentication - 1, MSG_NOSIGNAL);
    char byte = 0;
    const auto got = read(fd, &byte, 1);
    _exit(got == 0 || (got < 0 && errno == ECONNRESET) ? 0 : 1);
  }
  int status = 0;
  waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

TEST(DaemonAccount, AnAccountHasItsNumberAndAMissingOneHasNone) {
  EXPECT_EQ(accountNumber("root"), uid_t{0});
  EXPECT_EQ(accountNumber("no such account"), std::nullopt);
}

TEST_F(SocketTest, AForeignUserIsCutOffAndAnAllowedOneIsNot) {
  if (geteuid() != 0) GTEST_SKIP() << "becoming another user needs root";
  constexpr uid_t kNobody = 65534;
  ASSERT_EQ(chmod(directory_.path().c_str(), 0755), 0);
  for (const bool allowed : {false, true}) {
    SocketOptions options;
    options.listening_fd = dup(listen()->fd());
    if (allowed) options.allowed_uid = kNobody;
    auto host = ServiceHost::serveSocket(std::make_shared<Service>(), options);
    ASSERT_TRUE(host);
    EXPECT_EQ(readAsUser(kNobody, directory_.serviceSocket()), allowed ? 1 : 0);
    host->stop();
    host->waitUntilStopped();
    unlink(directory_.serviceSocket().c_str());
  }
}

}  // namespace
}  // namespace spacekeep::sdk
