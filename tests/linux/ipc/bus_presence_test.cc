// A bus that is not there, goes away, comes back, or does not give the name.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "tests/helpers/log_capture.h"
#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

using spacekeep::test::LogCapture;

constexpr std::uint64_t kQuietNs = 300'000'000;

TEST(BusPresence, WithoutABusThereIsOneNoteAndNoProblem) {
  const LogCapture log;
  const PrivateBus bus;
  const auto server = serverOn(bus);
  server->loop.runAndWait([] {});
  expectHonestClientIsServed(*server);
  EXPECT_EQ(log.countExact(kLogTrace,
                           "SpacekeepBus No bus at " + bus.socket() + ", clients use the socket"),
            1U);
  EXPECT_EQ(log.texts(kLogProblem).size(), 0U);
}

TEST(BusPresence, WithoutABusNothingWakesUp) {
  const PrivateBus bus;
  const auto server = serverOn(bus);
  server->loop.runAndWait([] {});
  EXPECT_EQ(wakeUpsInNs(server->loop, kQuietNs), 0U);
}

TEST(BusPresence, WithABusThatIsQuietNothingWakesUp) {
  PrivateBus bus;
  bus.start();
  const auto server = serverOn(bus);
  ASSERT_TRUE(BusClient(bus).isServed());
  server->loop.runAndWait([] {});
  EXPECT_EQ(wakeUpsInNs(server->loop, kQuietNs), 0U);
}

TEST(BusPresence, NobodyTakesTheNameAway) {
  PrivateBus bus;
  bus.start();
  const auto server = serverOn(bus);
  ASSERT_TRUE(BusClient(bus).isServed());
  BusClient other(bus);
  EXPECT_EQ(sd_bus_request_name(other.bus(), kTestBusName, SD_BUS_NAME_REPLACE_EXISTING), -EEXIST);
  EXPECT_EQ(other.number(3), "");
}

TEST(BusPresence, ABusThatAppearsLaterIsFound) {
  PrivateBus bus;
  const auto server = serverOn(bus);
  server->loop.runAndWait([] {});
  bus.start();
  EXPECT_TRUE(BusClient(bus).isServed());
}

TEST(BusPresence, ABusWhoseDirectoryAppearsLaterIsFound) {
  PrivateBus bus;
  bus.start();
  const spacekeep::test::TemporaryDirectory directory;
  BusOptions options = bus.options();
  options.socket = directory / "run/dbus/socket";
  TestServer server;
  server.server().serveOnBus(options);
  server.loop.runAndWait([] {});
  std::filesystem::create_directories(directory / "run");
  server.loop.runAndWait([] {});
  std::filesystem::create_directories(directory / "run/dbus");
  server.loop.runAndWait([] {});
  std::filesystem::create_hard_link(bus.socket(), options.socket);
  EXPECT_TRUE(BusClient(bus).isServed());
}

TEST(BusPresence, ABusThatGoesAwayAndComesBackIsServedAgain) {
  const LogCapture log;
  PrivateBus bus;
  bus.start();
  const auto server = serverOn(bus);
  ASSERT_TRUE(BusClient(bus).isServed());
  for (int i = 0; i < 3; ++i) {
    bus.stop();
    expectHonestClientIsServed(*server);
    bus.start();
    ASSERT_TRUE(BusClient(bus).isServed()) << i;
  }
  EXPECT_EQ(
      log.countExact(kLogTrace,
                     "SpacekeepBus serves as com.quorvel.Spacekeep on the bus at " + bus.socket()),
      4U);
  EXPECT_EQ(log.countExact(kLogProblem, "SpacekeepBus not on the bus at " + bus.socket() +
                                            ": the peer has left"),
            3U);
}

TEST(BusPresence, ACallThatIsAtWorkWhenTheBusGoesAwayIsWorkedOffForNobody) {
  PrivateBus bus;
  bus.start();
  const auto server = serverOn(bus);
  BusClient client(bus);
  ASSERT_TRUE(client.isServed());
  ASSERT_GE(sd_bus_send(client.bus(), client.newCall("hold").get(), nullptr), 0);
  sd_bus_flush(client.bus());
  ASSERT_TRUE(eventually([&] { return server->held() == 1; }));
  bus.stop();
  bus.start();
  BusClient next(bus);
  ASSERT_TRUE(next.isServed());
  server->takeHeld().reply({std::string("too late")});
  EXPECT_EQ(next.number(5), "");
}

TEST(BusPresence, WhoHasTheNameKeepsItAndThenItIsServed) {
  const LogCapture log;
  PrivateBus bus;
  bus.start();
  BusClient client(bus);
  auto other = std::make_unique<BusClient>(bus);
  ASSERT_GE(sd_bus_request_name(other->bus(), kTestBusName, 0), 0);
  const auto server = serverOn(bus);
  ASSERT_TRUE(eventually([&] {
    return log.countExact(kLogProblem, "SpacekeepBus not on the bus at " + bus.socket() +
                                           ": another program has the name com.quorvel.Spacekeep; "
                                           "it is served once that one gives it up") == 1;
  }));
  other.reset();
  EXPECT_TRUE(client.isServed());
}

TEST(BusPresence, ABusThatDoesNotGiveTheNameIsToldOnceHoweverOftenItIsTried) {
  const LogCapture log;
  PrivateBus bus;
  bus.start("");
  const auto server = serverOn(bus);
  ASSERT_TRUE(eventually([&] { return !log.texts(kLogProblem).empty(); }));
  rt::sleepNs(kQuietNs);  // some more tries
  EXPECT_EQ(log.texts(kLogProblem),
            std::vector<std::string>{"SpacekeepBus not on the bus at " + bus.socket() +
                                     ": the bus does not give the name com.quorvel.Spacekeep "
                                     "(org.freedesktop.DBus.Error.AccessDenied); is its policy "
                                     "installed?"});
  expectHonestClientIsServed(*server);
}

TEST(BusPresence, TheNameIsHadOnceTheBusGivesIt) {
  PrivateBus bus;
  bus.start("");
  const auto server = serverOn(bus);
  server->loop.runAndWait([] {});
  bus.stop();
  bus.start();
  EXPECT_TRUE(BusClient(bus).isServed());
}

TEST(BusPresence, SomethingElseAtTheSocketHarmsNobody) {
  const LogCapture log;
  const PrivateBus bus;
  std::string why;
  const SharedDescriptor silent = bindListeningSocket(bus.socket(), 0600, why);
  ServerOptions options = TestServer::defaultOptions();
  options.limits.authentication_ns = 50'000'000;
  const auto server = serverOn(bus, options);
  EXPECT_TRUE(eventually([&] {
    return log.countExact(kLogProblem, "SpacekeepBus not on the bus at " + bus.socket() +
                                           ": it did not authenticate in time") == 1;
  }));
  expectHonestClientIsServed(*server);
}

TEST(BusPresence, AFileWhereTheSocketShouldBeIsWaitedOut) {
  PrivateBus bus;
  { const std::ofstream file(bus.socket()); }
  const auto server = serverOn(bus);
  server->loop.runAndWait([] {});
  std::filesystem::remove(bus.socket());
  bus.start();
  EXPECT_TRUE(BusClient(bus).isServed());
}

TEST(BusPresence, AServerGoesWhileItsBusIsStuck) {
  PrivateBus bus;
  bus.start();
  auto server = serverOn(bus);
  ASSERT_TRUE(BusClient(bus).isServed());
  ::kill(bus.pid(), SIGSTOP);
  server.reset();
  ::kill(bus.pid(), SIGCONT);
}

}  // namespace
}  // namespace spacekeep::ipc::test
