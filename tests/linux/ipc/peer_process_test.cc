#include "support/ipc/linux/peer_process.h"

#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <fstream>
#include <functional>
#include <iterator>
#include <optional>
#include <string>
#include <thread>

#include "tests/helpers/threads/other_process.h"
#include "tests/linux/ipc/ipc_world.h"

namespace spacekeep::ipc::test {
namespace {

using spacekeep::test::OtherProcess;
using spacekeep::test::tellReady;

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

/// What is said of the process at the other end of a socket, if it is said at once. `meanwhile` comes
/// after it was remembered.
std::optional<bool> hasDied(
    IpcLoop& loop, int socket, const std::function<void()>& meanwhile = [] {}) {
  std::optional<PeerProcess> peer;
  std::optional<bool> died;
  loop.runAndWait([&] { peer.emplace(loop).remember(socket); });
  meanwhile();
  loop.runAndWait([&] {
    peer->whenKnown(10'000'000'000, [&died](bool has_died) { died = has_died; });
    peer.reset();
  });
  return died;
}

TEST(PeerProcess, ThatLivesIsKnownToLiveAtOnce) {
  IpcLoop loop;
  EXPECT_EQ(hasDied(loop, makeSocketPair().first->fd()), false);
}

TEST(PeerProcess, IsNotHeldForDyingBecauseItsNameLooksLikeTheFlagsOfOneThatDies) {
  IpcLoop loop;
  const ProcessName name(")R 1 1 1 1 1 4");
  EXPECT_EQ(hasDied(loop, makeSocketPair().first->fd()), false);
}

/// As the service manager hands it over.
void takeOver(int listening, int ready) {
  ::dup2(listening, SD_LISTEN_FDS_START);
  ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
  ::setenv("LISTEN_FDS", "1", 1);
  const auto taken = listeningSocketFromServiceManager();
  if (taken == nullptr) ::_exit(1);
  tellReady(ready);
  while (true) ::pause();
}

TEST(PeerProcess, AtASocketThatWasHandedOverIsWhoListensThereNow) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  const auto listening = bindListeningSocket(directory / "s", 0600, why);
  ASSERT_NE(listening, nullptr) << why;
  OtherProcess successor([&](int ready) { takeOver(listening->fd(), ready); });
  IpcLoop loop;
  const auto connected = connectSocket(directory / "s", why);
  ASSERT_NE(connected, nullptr) << why;
  EXPECT_EQ(hasDied(loop, connected->fd(), [&] { successor.end(); }), true);
}

TEST(PeerProcess, ThatHadDiedBeforeAnybodyConnectedIsKnownToBeDead) {
  const spacekeep::test::TemporaryDirectory directory;
  std::string why;
  const auto listening = bindListeningSocket(directory / "s", 0600, why);
  ASSERT_NE(listening, nullptr) << why;
  OtherProcess successor([&](int ready) { takeOver(listening->fd(), ready); });
  successor.end();
  IpcLoop loop;
  const auto connected = connectSocket(directory / "s", why);
  ASSERT_NE(connected, nullptr) << why;
  EXPECT_EQ(hasDied(loop, connected->fd()), true);
}

/// Listens, and goes on without its main thread.
void listenInAnotherThread(const std::string& path, int ready) {
  std::string why;
  static SharedDescriptor listening;  // of the process, whichever threads it has
  listening = bindListeningSocket(path, 0600, why);
  if (listening == nullptr) ::_exit(1);
  tellReady(ready);
  std::thread([] {
    while (true) ::pause();
  }).detach();
  ::syscall(SYS_exit, 0);
}

char stateOfMainThread(pid_t pid) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
  const std::string text((std::istreambuf_iterator<char>(file)), {});
  const std::size_t name_end = text.rfind(") ");
  return name_end == std::string::npos ? '?' : text.at(name_end + 2);
}

TEST(PeerProcess, WhoseMainThreadHasEndedLivesWhileAnotherOneDoes) {
  const spacekeep::test::TemporaryDirectory directory;
  OtherProcess process([&](int ready) { listenInAnotherThread(directory / "s", ready); });
  ASSERT_TRUE(eventually([&] { return stateOfMainThread(process.pid()) == 'Z'; }));
  IpcLoop loop;
  std::string why;
  const auto connected = connectSocket(directory / "s", why);
  ASSERT_NE(connected, nullptr) << why;
  EXPECT_EQ(hasDied(loop, connected->fd()), false);
  EXPECT_EQ(hasDied(loop, connected->fd(), [&] { process.end(); }), true);
}

}  // namespace
}  // namespace spacekeep::ipc::test
