// Services that pass a descriptor behind which nobody can answer.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <spacekeep/client.h>
#include <sys/socket.h>
#include <unistd.h>

#include <memory>
#include <string>

#include "client/client_protocol.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/linux/sockets.h"
#include "support/queues/waiting.h"
#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {
namespace {

class BadDescriptor : public testing::Test {
 protected:
  void SetUp() override {
    sandbox_.addVolume("tmp", "tmpfs", 16);
    sandbox_.start();
    daemon_ = sandbox_.startDaemon();
  }

  /// The error text with which the daemon answers a check-in with this descriptor; empty for none.
  std::string checkInWith(int fd) {
    ConcurrentQueue global({.name = "test"});
    ipc::IpcLoop loop;
    std::string why;
    auto connection = ipc::connectToPath(loop, global, sandbox_.socketPath(), why);
    if (!connection) return "no connection: " + why;
    auto answered = std::make_shared<CountingSemaphore>(0);
    auto text = std::make_shared<std::string>();
    connection->setRemoteInterface(spacekeepClientInterface());
    connection->resume();
    connection
        ->remoteProxy([answered, text](const ipc::Error& error) {
          *text = error.name;
          answered->signal();
        })
        ->call("clientCheckin",
               {std::string("bad"), std::make_shared<ipc::Descriptor>(fd),
                Dictionary{{"PURGE", true}}},
               [answered, text](const ipc::Arguments& answer) {
                 *text = std::get<ipc::OptionalString>(answer.at(1)).value_or("");
                 answered->signal();
               });
    EXPECT_EQ(answered->waitForNs(20'000'000'000), WaitResult::kSignalled);
    connection->invalidate();
    return *text;
  }

  void expectRefusedAndTheDaemonGoesOn(int fd, const std::string& why) {
    EXPECT_EQ(checkInWith(fd), "its endpoint cannot be used: " + why);
    auto client = sdk::Client::connect({.socket_path = sandbox_.socketPath(), .on_disconnect = {}});
    ASSERT_TRUE(client);
    const sdk::Reply reply = client->purge({.volume = "/volumes/tmp",
                                            .amount = 0,
                                            .urgency = 1,
                                            .timeout_seconds = {},
                                            .token = {},
                                            .finish_early = true});
    EXPECT_TRUE(reply.outcome);
    EXPECT_TRUE(daemon_.running());
  }

  Sandbox sandbox_;
  Process daemon_;
};

TEST_F(BadDescriptor, AFileIsRefused) {
  expectRefusedAndTheDaemonGoesOn(open("/dev/null", O_RDWR | O_CLOEXEC),
                                  "it is not a unix stream socket");
}

TEST_F(BadDescriptor, ADatagramSocketIsRefused) {
  int ends[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0, ends), 0);
  expectRefusedAndTheDaemonGoesOn(ends[0], "it is not a unix stream socket");
  close(ends[1]);
}

TEST_F(BadDescriptor, ASocketWhoseOtherEndIsClosedIsRefused) {
  int ends[2];
  ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends), 0);
  close(ends[1]);
  expectRefusedAndTheDaemonGoesOn(ends[0], "its other end is closed");
}

TEST_F(BadDescriptor, ASocketThatLeadsBackToTheDaemonIsRefused) {
  std::string why;
  const auto own = ipc::connectSocket(sandbox_.socketPath(), why);
  ASSERT_TRUE(own) << why;
  expectRefusedAndTheDaemonGoesOn(dup(own->fd()), "its other end is this process's own socket");
}

}  // namespace
}  // namespace spacekeep::system_test
