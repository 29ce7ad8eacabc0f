// A broker that says what the real one of these tests never says.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>
#include <unistd.h>

#include <ctime>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "support/access/peer_identity.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

/// The other end of the server's connection to a bus, by sd-bus in the role of a server. Everything
/// happens within the calls of the test.
class FakeBroker {
 public:
  using Fill = std::function<void(sd_bus_message* answer)>;

  FakeBroker() {
    std::string why;
    listening_ = bindListeningSocket(path(), 0600, why);
    EXPECT_EQ(why, "");
  }
  ~FakeBroker() { sd_bus_close_unref(bus_); }
  FakeBroker(const FakeBroker&) = delete;
  FakeBroker& operator=(const FakeBroker&) = delete;

  [[nodiscard]] std::string path() const { return directory_ / "bus"; }
  /// What is in the answer about who a sender is. Without it, an error is answered.
  void setCredentials(Fill fill) { credentials_ = std::move(fill); }
  void setNameAnswer(std::uint32_t answer) { name_answer_ = answer; }
  /// Who the answers say that they come from.
  void setSender(const char* sender) { sender_ = sender; }

  void accept() {
    int fd = -1;
    ASSERT_TRUE(eventually([&] {
      fd = ::accept4(listening_->fd(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
      return fd >= 0;
    }));
    ASSERT_GE(sd_bus_new(&bus_), 0);
    ASSERT_GE(sd_bus_set_server(bus_, 1, sd_id128_t{}), 0);
    ASSERT_GE(sd_bus_negotiate_fds(bus_, 1), 0);
    ASSERT_GE(sd_bus_set_fd(bus_, fd, fd), 0);
    ASSERT_GE(sd_bus_start(bus_), 0);
    ASSERT_GE(sd_bus_add_filter(bus_, nullptr, &FakeBroker::onMessage, this), 0);
  }
  /// Once sd-bus has started, which raises it as far as it may.
  void setSendBuffer(int bytes) {
    EXPECT_EQ(::setsockopt(sd_bus_get_fd(bus_), SOL_SOCKET, SO_SNDBUF, &bytes, sizeof bytes), 0);
  }
  [[nodiscard]] bool hasUnsentMessages() const {
    std::uint64_t count = 0;
    return sd_bus_get_n_queued_write(bus_, &count) >= 0 && count > 0;
  }
  void pump() {
    while (sd_bus_process(bus_, nullptr) > 0) {
    }
  }
  /// A call of "number" by the sender of that name. The name of the error, empty for success.
  std::string numberFrom(const char* sender) {
    sendNumberFrom(sender);
    return errorOfLastCall();
  }
  void sendNumberFrom(const char* sender) {
    sendFrom(sender, "number",
             [](sd_bus_message* call) { EXPECT_GE(sd_bus_message_append(call, "i", 7), 0); });
  }
  void sendFrom(const char* sender, const char* member, const Fill& fill) {
    sd_bus_message* made = nullptr;
    EXPECT_GE(sd_bus_message_new_method_call(bus_, &made, nullptr, kObjectPath,
                                             "com.quorvel.IpcTest", member),
              0);
    const OwnedMessage call(made);
    fill(made);
    EXPECT_GE(sd_bus_message_set_sender(made, sender), 0);
    answered_ = false;
    EXPECT_GE(sd_bus_send(bus_, made, &call_), 0);
  }
  std::string errorOfLastCall() {
    EXPECT_TRUE(eventually([this] {
      pump();
      return answered_;
    }));
    return error_;
  }

 private:
  static int onMessage(sd_bus_message* message, void* self, sd_bus_error*) {
    static_cast<FakeBroker*>(self)->take(message);
    return 1;
  }
  void take(sd_bus_message* message) {
    std::uint64_t serial = 0;
    if (sd_bus_message_get_reply_cookie(message, &serial) >= 0) {
      if (serial != call_) return;
      answered_ = true;
      const sd_bus_error* error = sd_bus_message_get_error(message);
      error_ = error == nullptr ? "" : error->name;
      return;
    }
    const char* name = sd_bus_message_get_member(message);
    const std::string_view member = name == nullptr ? "" : name;
    if (member == "Hello") {
      answer(message, [](sd_bus_message* reply) { sd_bus_message_append(reply, "s", ":1.1"); });
    } else if (member == "RequestName") {
      answer(message,
             [this](sd_bus_message* reply) { sd_bus_message_append(reply, "u", name_answer_); });
    } else if (member == "GetConnectionCredentials" && credentials_) {
      answer(message, credentials_);
    } else if (member == "GetConnectionCredentials") {
      refuse(message);
    }
  }
  void refuse(sd_bus_message* call) {
    const OwnedMessage error =
        errorAnswer(call, "org.freedesktop.DBus.Error.NameHasNoOwner", "gone");
    EXPECT_GE(sd_bus_message_set_sender(error.get(), sender_.c_str()), 0);
    EXPECT_GE(sd_bus_send(bus_, error.get(), nullptr), 0);
  }
  void answer(sd_bus_message* call, const Fill& fill) {
    sd_bus_message* made = nullptr;
    EXPECT_GE(sd_bus_message_new_method_return(call, &made), 0);
    const OwnedMessage reply(made);
    fill(made);
    EXPECT_GE(sd_bus_message_set_sender(made, sender_.c_str()), 0);
    EXPECT_GE(sd_bus_send(bus_, made, nullptr), 0);
  }

  spacekeep::test::TemporaryDirectory directory_;
  SharedDescriptor listening_;
  sd_bus* bus_ = nullptr;
  Fill credentials_;
  std::uint32_t name_answer_ = 1;
  std::uint64_t call_ = 0;
  bool answered_ = false;
  std::string error_;
  std::string sender_ = "org.freedesktop.DBus";
};

class FakeBrokerTest : public ::testing::Test {
 protected:
  void serve() {
    ServerOptions options = TestServer::defaultOptions();
    options.limits.connections = callers;
    options.admit = [this](PeerConnection& peer, std::string&) {
      has_process_ = peer.identity().pidfd() != nullptr;
      unclear_ = peer.identity().unclear();
      return true;
    };
    server = std::make_unique<TestServer>(options);
    BusOptions bus;
    bus.socket = broker.path();
    bus.name = kTestBusName;
    bus.first_pause_ns = 20'000'000;
    server->server().serveOnBus(bus);
    broker.accept();
  }

  FakeBroker broker;
  std::unique_ptr<TestServer> server;
  std::size_t callers = 1024;  // that are remembered
  bool has_process_ = false;
  access::UnclearFacts unclear_;
};

TEST_F(FakeBrokerTest, AProcessThatTheBrokerPassesOnIsTaken) {
  serve();
  const int pidfd = static_cast<int>(::syscall(SYS_pidfd_open, ::getpid(), 0));
  ASSERT_GE(pidfd, 0);
  broker.setCredentials([pidfd](sd_bus_message* answer) {
    EXPECT_GE(
        sd_bus_message_append(answer, "a{sv}", 2, "UnixUserID", "u", 0, "ProcessFD", "h", pidfd),
        0);
  });
  EXPECT_EQ(broker.numberFrom(":1.7"), "");
  ::close(pidfd);
  server->stop();
  EXPECT_TRUE(has_process_);
  EXPECT_FALSE(unclear_.unit);
  EXPECT_TRUE(unclear_.groups);
}

TEST_F(FakeBrokerTest, ASenderWhomTheBrokerDoesNotKnowIsRefused) {
  serve();
  EXPECT_EQ(broker.numberFrom(":1.7"), "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_EQ(server->served(), 0U);
}

TEST_F(FakeBrokerTest, ASenderWithoutAUserIsRefused) {
  serve();
  broker.setCredentials([](sd_bus_message* answer) {
    EXPECT_GE(sd_bus_message_append(answer, "a{sv}", 1, "ProcessID", "u", 1), 0);
  });
  EXPECT_EQ(broker.numberFrom(":1.7"), "org.freedesktop.DBus.Error.AccessDenied");
  EXPECT_EQ(server->served(), 0U);
}

TEST_F(FakeBrokerTest, AnAnswerThatIsNoneIsARefusal) {
  serve();
  broker.setCredentials(
      [](sd_bus_message* answer) { EXPECT_GE(sd_bus_message_append(answer, "s", "root"), 0); });
  EXPECT_EQ(broker.numberFrom(":1.7"), "org.freedesktop.DBus.Error.AccessDenied");
}

TEST_F(FakeBrokerTest, WhoASenderIsIsAskedOnce) {
  serve();
  int asked = 0;
  broker.setCredentials([&asked](sd_bus_message* answer) {
    ++asked;
    EXPECT_GE(sd_bus_message_append(answer, "a{sv}", 1, "UnixUserID", "u", 0), 0);
  });
  for (int i = 0; i < 3; ++i) EXPECT_EQ(broker.numberFrom(":1.7"), "");
  EXPECT_EQ(asked, 1);
  EXPECT_EQ(broker.numberFrom(":1.8"), "");
  EXPECT_EQ(asked, 2);
}

/// There is room for two callers: `first` and `second` call, `first` again, then a third one.
class RoomForTwoCallers : public FakeBrokerTest {
 protected:
  void expectThatTheSecondIsForgotten(const char* first, const char* second) {
    callers = 2;
    serve();
    int asked = 0;
    broker.setCredentials([&asked](sd_bus_message* answer) {
      ++asked;
      EXPECT_GE(sd_bus_message_append(answer, "a{sv}", 1, "UnixUserID", "u", 0), 0);
    });
    for (const char* caller : {first, second, first, ":1.9"}) {
      EXPECT_EQ(broker.numberFrom(caller), "") << caller;
    }
    EXPECT_EQ(asked, 3);
    EXPECT_EQ(broker.numberFrom(first), "");
    EXPECT_EQ(asked, 3);
    EXPECT_EQ(broker.numberFrom(second), "");
    EXPECT_EQ(asked, 4);
  }
};

TEST_F(RoomForTwoCallers, WhoWasQuietForLongestIsForgottenForANewOne) {
  expectThatTheSecondIsForgotten(":1.7", ":1.8");
}

TEST_F(RoomForTwoCallers, WhoWasQuietForLongestIsForgottenInWhicheverOrderTheirNamesStand) {
  expectThatTheSecondIsForgotten(":1.8", ":1.7");
}

TEST_F(FakeBrokerTest, AnAnswerThatSomebodyElseSendsCountsForNothing) {
  serve();
  int asked = 0;
  broker.setCredentials([this, &asked](sd_bus_message* answer) {
    // The first one comes from somebody who must not speak for the broker.
    broker.setSender(++asked == 1 ? ":1.66" : "org.freedesktop.DBus");
    EXPECT_GE(sd_bus_message_append(answer, "a{sv}", 1, "UnixUserID", "u", 0), 0);
  });
  broker.sendNumberFrom(":1.66");
  EXPECT_EQ(broker.numberFrom(":1.7"), "");
  EXPECT_EQ(asked, 2);
  EXPECT_EQ(server->served(), 1U);
}

/// An answer that was written in several parts, while nothing came.
class AfterALargeAnswer : public FakeBrokerTest {
 protected:
  void SetUp() override {
    broker.setCredentials([](sd_bus_message* answer) {
      EXPECT_GE(sd_bus_message_append(answer, "a{sv}", 1, "UnixUserID", "u", 0), 0);
    });
    serve();
    ASSERT_EQ(broker.numberFrom(":1.7"), "");
    broker.sendFrom(":1.7", "hold", [](sd_bus_message*) {});
    ASSERT_TRUE(eventually([this] { return server->held() == 1; }));
    server->takeHeld().reply({std::string(900'000, 'x')});
    server->loop.runAndWait([] {});
    ASSERT_EQ(broker.errorOfLastCall(), "");
  }
};

TEST_F(AfterALargeAnswer, ACallWithADescriptorIsRefusedAndTheBusIsServedOn) {
  const SocketPair pair = makeSocketPair();
  broker.sendFrom(":1.7", "takeDescriptor", [&pair](sd_bus_message* call) {
    EXPECT_GE(sd_bus_message_append(call, "hs", pair.first->fd(), "text"), 0);
  });
  EXPECT_EQ(broker.errorOfLastCall(), "org.freedesktop.DBus.Error.NotSupported");
  EXPECT_EQ(broker.numberFrom(":1.8"), "");
}

TEST_F(AfterALargeAnswer, ACallBeyondTheSizeLimitIsRefusedAndTheBusIsServedOn) {
  broker.sendFrom(":1.7", "takeDescriptor", [](sd_bus_message* call) {
    EXPECT_GE(sd_bus_message_append(call, "s", std::string(2 * 1024 * 1024, 'x').c_str()), 0);
  });
  EXPECT_EQ(broker.errorOfLastCall(), "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(broker.numberFrom(":1.8"), "");
}

TEST_F(AfterALargeAnswer, TheRestOfACallBeyondTheSizeLimitIsAwaitedWithoutProcessorTime) {
  broker.setSendBuffer(64 * 1024);
  broker.sendFrom(":1.7", "takeDescriptor", [](sd_bus_message* call) {
    EXPECT_GE(sd_bus_message_append(call, "s", std::string(8 * 1024 * 1024, 'x').c_str()), 0);
  });
  ASSERT_TRUE(broker.hasUnsentMessages());  // and sends them only when this test lets it go on
  EXPECT_TRUE(eventually([this] {
    const std::clock_t before = std::clock();
    return wakeUpsInNs(server->loop, 300'000'000) <= 1 &&
           std::clock() - before < CLOCKS_PER_SEC / 10;
  }));
  EXPECT_EQ(broker.errorOfLastCall(), "org.freedesktop.DBus.Error.LimitsExceeded");
}

TEST_F(FakeBrokerTest, ANameAnswerThatNobodyKnowsIsAProblemAndTriedAgain) {
  const spacekeep::test::LogCapture log;
  broker.setNameAnswer(3);
  serve();
  EXPECT_TRUE(eventually([&] {
    broker.pump();
    return log.count(kLogProblem, "the bus does not give the name com.quorvel.Spacekeep") == 1;
  }));
}

}  // namespace
}  // namespace spacekeep::ipc::test
