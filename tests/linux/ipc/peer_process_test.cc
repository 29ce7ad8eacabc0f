#include "support/ipc/linux/peer_process.h"

#include <gtest/gtest.h>
#include <sys/prctl.h>

#include <array>
#include <optional>

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

}  // namespace
}  // namespace spacekeep::ipc::test
