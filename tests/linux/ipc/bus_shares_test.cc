// Users share the bus front as they share the socket: none of them takes it from the others.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <csignal>
#include <string>
#include <utility>
#include <vector>

#include "tests/linux/ipc/bus_world.h"

namespace spacekeep::ipc::test {
namespace {

/// Floods under that user's account while it is in scope.
class Flood {
 public:
  Flood(uid_t uid, const PrivateBus& bus, const char* member) {
    int ready[2] = {-1, -1};
    EXPECT_EQ(::pipe2(ready, O_CLOEXEC), 0);
    const std::string program = std::string(SPACEKEEP_BUILD_DIR) + "/tests/bus-flooder";
    const std::string user = "--reuid=" + std::to_string(uid);
    pid_ = ::fork();
    if (pid_ == 0) {
      ::dup2(ready[1], 1);
      ::execlp("setpriv", "setpriv", user.c_str(), "--regid=60", "--clear-groups", program.c_str(),
               bus.socket().c_str(), kTestBusName, kObjectPath, "com.quorvel.IpcTest", member,
               nullptr);
      ::_exit(127);
    }
    ::close(ready[1]);
    char first = 0;
    EXPECT_EQ(::read(ready[0], &first, 1), 1) << "the flood did not begin";
    ::close(ready[0]);
  }
  ~Flood() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  Flood(const Flood&) = delete;
  Flood& operator=(const Flood&) = delete;

 private:
  pid_t pid_ = -1;
};

std::uint64_t nowNs() {
  timespec now{};
  ::clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1'000'000'000 +
         static_cast<std::uint64_t>(now.tv_nsec);
}

class BusShares : public ::testing::Test {
 protected:
  void SetUp() override {
    bus.start();
    server = serverOn(bus);
    client = std::make_unique<BusClient>(bus);
    ASSERT_TRUE(client->isServed());
  }

  PrivateBus bus;
  std::unique_ptr<TestServer> server;
  std::unique_ptr<BusClient> client;
};

TEST_F(BusShares, AUserWhoFloodsIsServedNoMoreThanItsShare) {
  const std::size_t served_before = server->served();
  const std::uint64_t begin = nowNs();
  std::size_t own = 0;
  {
    const Flood flood(kGamesAccount, bus, "number");
    const auto has_flooded = [&] { return server->served() - served_before - own > 50; };
    while (nowNs() - begin < 1'000'000'000 || (!has_flooded() && nowNs() - begin < kLongNs)) {
      ASSERT_EQ(client->number(static_cast<std::int32_t>(own)), "");
      ++own;
    }
  }
  const UserShareLimits limits;
  const std::uint64_t share_ns = limits.saved_ns + (nowNs() - begin) / 100 * limits.percent;
  const std::uint64_t most = share_ns / (limits.message_ns + limits.long_call_ns) + 1;
  const std::size_t flooded = server->served() - served_before - own;
  EXPECT_GT(flooded, 50U);
  EXPECT_LE(flooded, most);
}

TEST_F(BusShares, OtherUsersAreServedOnTheBusAndOnTheSocketMeanwhile) {
  const Flood one(kGamesAccount, bus, "number");
  const Flood two(kGamesAccount, bus, "numberBriefly");
  for (int i = 0; i < 5; ++i) {
    EXPECT_EQ(busctlAs(kDaemonAccount, bus, {"number", "i", "7"}).text, "i 7\n");
    EXPECT_EQ(client->number(i), "");
    expectHonestClientIsServed(*server);
  }
}

TEST_F(BusShares, WhoCallsTooFastIsServedLaterAndInOrder) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.shares.limits_privileged_users = true;
  options.limits.shares.saved_ns = 5'000'000;
  server = serverOn(bus, options);
  BusClient hasty(bus);
  ASSERT_TRUE(hasty.isServed());
  std::vector<std::int32_t> sent = server->numbers();
  for (std::int32_t i = 0; i < 60; ++i) {
    const OwnedMessage call = hasty.newCall("number");
    ASSERT_GE(sd_bus_message_append(call.get(), "i", i), 0);
    ASSERT_GE(sd_bus_send(hasty.bus(), call.get(), nullptr), 0);
    sent.push_back(i);
  }
  ASSERT_EQ(hasty.number(60), "");
  sent.push_back(60);
  EXPECT_EQ(server->numbers(), sent);
}

TEST_F(BusShares, WhoHasTooManyCallsWaitingIsToldSo) {
  ServerOptions options = TestServer::defaultOptions();
  options.limits.shares.limits_privileged_users = true;
  options.limits.shares.saved_ns = options.limits.shares.connection_ns;
  options.limits.shares.percent = 0;  // after the first call, nothing comes back
  options.limits.unanswered_calls = 4;
  server = serverOn(bus, options);
  BusClient hasty(bus);
  ASSERT_TRUE(hasty.isServed());
  for (int i = 0; i < 4; ++i) {
    const OwnedMessage call = hasty.newCall("number");
    ASSERT_GE(sd_bus_message_append(call.get(), "i", i), 0);
    ASSERT_GE(sd_bus_send(hasty.bus(), call.get(), nullptr), 0);
  }
  OwnedMessage call = hasty.newCall("number");
  ASSERT_GE(sd_bus_message_append(call.get(), "i", 5), 0);
  const BusAnswer answer = hasty.call(std::move(call));
  EXPECT_EQ(answer.error, "org.freedesktop.DBus.Error.LimitsExceeded");
  EXPECT_EQ(answer.text, "4 calls of this connection wait; wait for answers");
}

}  // namespace
}  // namespace spacekeep::ipc::test
