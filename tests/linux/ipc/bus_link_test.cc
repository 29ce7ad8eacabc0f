// What only the owner of a connection's own link sees.
#include "support/ipc/linux/bus_link.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <memory>
#include <string>
#include <string_view>
#include <utility>

#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

using namespace std::string_view_literals;

/// The daemon's end of a connection. What it is to do with a message is the test's.
class Owner : public BusLink::Owner {
 public:
  Owner(IpcLoop& loop, int socket, std::function<void(BusLink&)> take)
      : take_(std::move(take)),
        loop_(loop),
        link_(std::make_unique<BusLink>(loop, *this, Authentication::Role::kServer,
                                        LinkLimits{.authentication_ns = kLongNs,
                                                   .message_bytes = 1 << 20,
                                                   .queued_messages = 1000,
                                                   .queued_bytes = 1 << 30})) {
    loop_.runAndWait([this, socket] { link_->start(socket, ::getuid()); });
  }
  ~Owner() override {
    loop_.runAndWait([this] { link_.reset(); });
  }

  // Any thread.
  [[nodiscard]] bool isReady() const { return is_ready_; }
  [[nodiscard]] int messages() const { return messages_; }

 private:
  void linkReady() override { is_ready_ = true; }
  void linkMessage(sd_bus_message*) override {
    ++messages_;
    take_(*link_);
  }
  void linkEnded(LinkEnd, const std::string& why) override { ADD_FAILURE() << why; }

  const std::function<void(BusLink&)> take_;
  std::atomic<bool> is_ready_ = false;
  std::atomic<int> messages_ = 0;
  IpcLoop& loop_;
  std::unique_ptr<BusLink> link_;
};

/// Sends until something has to wait for the peer to read.
void sendUntilItWaits(BusLink& link) {
  const std::string much(60'000, 'x');
  while (link.queuedMessages() == 0) {
    sd_bus_message* made = nullptr;
    ASSERT_GE(sd_bus_message_new_signal(link.bus(), &made, kObjectPath, "com.quorvel.IpcTest", "s"),
              0);
    const OwnedMessage message(made);
    ASSERT_GE(sd_bus_message_append(message.get(), "s", much.c_str()), 0);
    ASSERT_TRUE(link.send(message.get(), much.size()));
  }
}

void readAway(int socket) {
  std::array<char, 65'536> bytes;  // NOLINT: never read
  while (::recv(socket, bytes.data(), bytes.size(), MSG_DONTWAIT) > 0) {
  }
}

std::string threeCalls() {
  std::string calls;
  for (std::uint32_t serial = 1; serial <= 3; ++serial) {
    calls += RawMessage().callOf("number").bytes(kWireCall, serial);
  }
  return calls;
}

// sd-bus writes first, and reads nothing in the same turn when a message has gone to its end by that.
TEST(BusLink, ACallIsReadThatWasThereWhenThePeerMadeRoomForAnAnswer) {
  IpcLoop loop;
  const SocketPair pair = makeSocketPair();
  const int peer = pair.second->fd();
  Owner owner(loop, pair.first->fd(), [peer, calls = 0](BusLink& link) mutable {
    if (++calls > 1) return;
    sendUntilItWaits(link);
    readAway(peer);
  });
  constexpr auto kOpening = "\0AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n"sv;
  ASSERT_EQ(::send(peer, kOpening.data(), kOpening.size(), MSG_NOSIGNAL), kOpening.size());
  ASSERT_TRUE(eventually([&] { return owner.isReady(); }));
  const std::string calls = threeCalls();
  ASSERT_EQ(::send(peer, calls.data(), calls.size(), MSG_NOSIGNAL), calls.size());
  EXPECT_TRUE(eventually([&] { return owner.messages() == 3; }));
}

}  // namespace
}  // namespace spacekeep::ipc::test
