#include "support/ipc/linux/peer_process.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <functional>
#include <optional>
#include <string>

#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

/// The name of this process as others see it, for a while.
class ProcessName {
 public:
  explicit ProcessName(const char* name) {
    EXPECT_EQ(::prctl(PR_GET_NAME, before_.data()), 0);
    EXPECT_EQ(::prctl(PR_SET_NAME, name), 0);
  }
  ~ProcessName() { ::prctl(PR_SET_NAME, before_.data()); }
  ProcessName(const ProcessName&) = delete;
  ProcessName& operator=(const ProcessName&) = delete;

 private:
  std::array<char, 16> before_{};
};

/// A process that does `work`, which says when it is ready, and then nothing until it is ended.
class OtherProcess {
 public:
  explicit OtherProcess(const std::function<void(int ready)>& work) {
    std::array<int, 2> ready{};
    EXPECT_EQ(::pipe2(ready.data(), O_CLOEXEC), 0);
    pid_ = ::fork();
    if (pid_ == 0) {
      work(ready[1]);
      while (true) ::pause();
    }
    ::close(ready[1]);
    char byte = 0;
    EXPECT_EQ(::read(ready[0], &byte, 1), 1);
    ::close(ready[0]);
  }
  ~OtherProcess() { end(); }
  OtherProcess(const OtherProcess&) = delete;
  OtherProcess& operator=(const OtherProcess&) = delete;

  void end() {
    if (pid_ <= 0) return;
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

 private:
  pid_t pid_ = -1;
};

/// What is said of this process at the other end of a socket, if it is said at once.
std::optional<bool> hasDied(IpcLoop& loop) {
  const SocketPair pair = makeSocketPair();
  std::optional<bool> died;
  loop.runAndWait([&] {
    PeerProcess peer(loop);
    peer.remember(pair.first->fd());
    peer.whenKnown(10'000'000'000, [&died](bool has_died) { died = has_died; });
    peer.forget();
  });
  return died;
}

TEST(PeerProcess, ThatLivesIsKnownToLiveAtOnce) {
  TestServer server;
  EXPECT_EQ(hasDied(server.loop), false);
}

TEST(PeerProcess, IsNotHeldForDyingBecauseItsNameLooksLikeTheFlagsOfOneThatDies) {
  TestServer server;
  const ProcessName name(")R 1 1 1 1 1 4");
  EXPECT_EQ(hasDied(server.loop), false);
}

/// As the service manager hands it over.
void takeOver(int listening, int ready) {
  ::dup2(listening, SD_LISTEN_FDS_START);
  ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  ::setenv("LISTEN_FDS", "1", 1);
  const auto taken = listeningSocketFromServiceManager();
  if (taken == nullptr || ::write(ready, "x", 1) != 1) ::_exit(1);
  while (true) ::pause();
}

TEST(PeerProcess, AtASocketThatWasHandedOverIsWhoListensThereNow) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  const auto listening = bindListeningSocket(directory / "s", 0600, why);
  ASSERT_NE(listening, nullptr) << why;
  OtherProcess successor([&](int ready) { takeOver(listening->fd(), ready); });
  IpcLoop loop;
  std::optional<PeerProcess> peer;
  std::optional<bool> died;
  const auto connected = connectSocket(directory / "s", why);
  ASSERT_NE(connected, nullptr) << why;
  loop.runAndWait([&] { peer.emplace(loop).remember(connected->fd()); });
  successor.end();
  loop.runAndWait([&] {
    peer->whenKnown(10'000'000'000, [&died](bool has_died) { died = has_died; });
    peer.reset();
  });
  EXPECT_EQ(died, true);
}

}  // namespace
}  // namespace spacekeep::ipc::test
