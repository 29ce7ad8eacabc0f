#include "support/events/linux/system_bus.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <array>
#include <atomic>
#include <cerrno>
#include <thread>

#include "tests/linux/events/event_world.h"

namespace spacekeep {
namespace {

using test::comesTrue;
using test::ScratchDirectory;

/// A message bus of the test's own, with the reference implementation.
class PrivateBus {
 public:
  PrivateBus() : socket(directory_.path() + "/bus") {
    const std::string config = directory_.write(
        "bus.conf",
        "<busconfig><type>system</type><listen>unix:path=" + socket +
            "</listen><policy context=\"default\"><allow send_destination=\"*\"/><allow own=\"*\"/>"
            "<allow receive_sender=\"*\"/><allow user=\"*\"/></policy></busconfig>");
    const std::string option = "--config-file=" + config;
    pid_ = ::fork();
    if (pid_ == 0) {
      ::execlp("dbus-daemon", "dbus-daemon", "--nofork", "--nopidfile", option.c_str(), nullptr);
      ::_exit(127);
    }
    EXPECT_TRUE(comesTrue([this] { return listens(); }));
  }
  ~PrivateBus() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  [[nodiscard]] sd_bus* connect() const {
    sd_bus* bus = nullptr;
    EXPECT_GE(sd_bus_new(&bus), 0);
    EXPECT_GE(sd_bus_set_address(bus, ("unix:path=" + socket).c_str()), 0);
    EXPECT_GE(sd_bus_set_bus_client(bus, 1), 0);
    EXPECT_GE(sd_bus_start(bus), 0);
    return bus;
  }

 private:
  /// The socket is there a moment before it is listened at.
  [[nodiscard]] bool listens() const {
    sockaddr_un address{.sun_family = AF_UNIX, .sun_path = {}};
    socket.copy(address.sun_path, sizeof(address.sun_path) - 1);
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const bool connected =
        ::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof(address)) == 0;
    ::close(fd);
    return connected;
  }

  ScratchDirectory directory_;
  pid_t pid_ = -1;

 public:
  const std::string socket;
};

void processUntil(sd_bus* bus, const std::atomic<bool>& done) {
  while (!done) {
    while (sd_bus_process(bus, nullptr) > 0) {
    }
    sd_bus_wait(bus, 20'000);
  }
}

TEST(SystemBus, TheSignalArrivesUnderItsName) {
  const PrivateBus bus;
  sd_bus* listener = bus.connect();
  std::atomic<bool> arrived{false};
  const auto note = [](sd_bus_message* message, void* seen, sd_bus_error*) {
    EXPECT_STREQ(sd_bus_message_get_path(message), "/com/quorvel/Spacekeep");
    *static_cast<std::atomic<bool>*>(seen) = true;
    return 0;
  };
  ASSERT_GE(sd_bus_match_signal(listener, nullptr, nullptr, nullptr, "com.quorvel.spacekeep",
                                "launched", note, &arrived),
            0);
  EXPECT_EQ(emitSystemSignal(bus.socket, "com.quorvel.spacekeep.launched"), 0);
  EXPECT_TRUE(comesTrue([&] {
    while (sd_bus_process(listener, nullptr) > 0) {
    }
    return arrived.load();
  }));
  sd_bus_flush_close_unref(listener);
}

/// Answers Inhibit as the login manager does: with the writing end of a pipe.
struct LoginManager {
  std::string asked;
  std::array<int, 2> ends{-1, -1};
};

int inhibit(sd_bus_message* message, void* manager, sd_bus_error*) {
  auto& self = *static_cast<LoginManager*>(manager);
  const char* what = nullptr;
  const char* who = nullptr;
  const char* why = nullptr;
  const char* mode = nullptr;
  if (sd_bus_message_read(message, "ssss", &what, &who, &why, &mode) < 0) return -EINVAL;
  self.asked = std::string(what) + "|" + who + "|" + why + "|" + mode;
  const int result = sd_bus_reply_method_return(message, "h", self.ends[1]);
  ::close(self.ends[1]);
  return result;
}

TEST(SystemBus, TheInhibitorIsHeldUntilItsDescriptorIsClosed) {
  const PrivateBus bus;
  LoginManager manager;
  ASSERT_EQ(::pipe2(manager.ends.data(), O_CLOEXEC | O_NONBLOCK), 0);
  sd_bus* served = bus.connect();
  static const sd_bus_vtable kVtable[] = {
      SD_BUS_VTABLE_START(0), SD_BUS_METHOD("Inhibit", "ssss", "h", inhibit, 0), SD_BUS_VTABLE_END};
  ASSERT_GE(sd_bus_add_object_vtable(served, nullptr, "/org/freedesktop/login1",
                                     "org.freedesktop.login1.Manager", kVtable, &manager),
            0);
  ASSERT_GE(sd_bus_request_name(served, "org.freedesktop.login1", 0), 0);
  std::atomic<bool> done{false};
  std::thread server([&] { processUntil(served, done); });

  auto inhibitor = inhibitSleep(bus.socket, "Freeing storage space");
  done = true;
  server.join();
  sd_bus_flush_close_unref(served);
  ASSERT_NE(inhibitor, nullptr);
  EXPECT_EQ(manager.asked, "sleep|Spacekeep|Freeing storage space|block");
  char byte = 0;
  EXPECT_EQ(::read(manager.ends[0], &byte, 1), -1) << "still held";
  EXPECT_EQ(errno, EAGAIN);
  inhibitor = nullptr;
  EXPECT_TRUE(comesTrue([&] { return ::read(manager.ends[0], &byte, 1) == 0; }));
  ::close(manager.ends[0]);
}

TEST(SystemBus, WithoutALoginManagerThereIsNoInhibitor) {
  const PrivateBus bus;
  EXPECT_EQ(inhibitSleep(bus.socket, "why"), nullptr);
}

TEST(SystemBus, WithoutABusBothDoNothing) {
  EXPECT_EQ(emitSystemSignal("/nowhere/bus", "com.quorvel.spacekeep.launched"), ENOENT);
  EXPECT_EQ(inhibitSleep("/nowhere/bus", "why"), nullptr);
}

TEST(SystemBus, ANameWithoutADotIsRefused) {
  EXPECT_EQ(emitSystemSignal("/nowhere/bus", "launched"), EINVAL);
}

}  // namespace
}  // namespace spacekeep
