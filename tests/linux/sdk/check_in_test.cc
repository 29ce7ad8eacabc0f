#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <spacekeep/service.h>
#include <stdlib.h>

#include <atomic>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "tests/linux/sdk/fake_daemon.h"
#include "tests/linux/sdk/test_service.h"

namespace spacekeep::sdk {
namespace {

using std::chrono::milliseconds;
using testing::HasSubstr;

class CheckInTest : public testing::Test {
 protected:
  CheckInOptions options() {
    CheckInOptions result;
    result.socket_path = directory_.daemonSocket();
    result.on_status = [this](const HostStatus& status) {
      history_.update([&](auto& list) { list.push_back(status); });
    };
    return result;
  }
  ServiceHost checkIn(CheckInOptions options) {
    auto host = ServiceHost::checkIn("org.example.cache", service_, std::move(options));
    EXPECT_TRUE(host);
    return std::move(*host);
  }
  [[nodiscard]] int timesIn(HostState state) const {
    int times = 0;
    for (const auto& status : history_.get()) times += status.state == state ? 1 : 0;
    return times;
  }
  [[nodiscard]] std::string lastTextOf(HostState state) const {
    std::string text;
    for (const auto& status : history_.get()) {
      if (status.state == state) text = status.text;
    }
    return text;
  }
  [[nodiscard]] bool reaches(HostState state, int times = 1) const {
    return eventually([&] { return timesIn(state) >= times; });
  }
  static bool pings(const SpacekeepServiceProtocol& service) {
    const auto pong = std::make_shared<CountingSemaphore>(0);
    service.servicePing([pong] { pong->signal(); });
    return pong->waitForNs(20'000'000'000) == WaitResult::kSignalled;
  }

  SocketDirectory directory_;
  rt::Guarded<std::vector<HostStatus>> history_;
  rt::Guarded<std::vector<std::shared_ptr<SpacekeepServiceProtocol>>> registered_;
  std::shared_ptr<TestService> service_ = std::make_shared<TestService>();
  FakeDaemon daemon_{directory_.daemonSocket()};
};

TEST_F(CheckInTest, TheEnvironmentNamesTheDaemonOfAProgramThatNamesNone) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  ASSERT_EQ(setenv("SPACEKEEP_SOCKET", directory_.daemonSocket().c_str(), 1), 0);
  CheckInOptions unnamed = options();
  unnamed.socket_path = kDefaultSocketPath;
  const ServiceHost host = checkIn(unnamed);
  EXPECT_TRUE(reaches(HostState::kServing));
}

TEST_F(CheckInTest, ASocketThatTheProgramNamesWinsOverTheEnvironment) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  ASSERT_EQ(setenv("SPACEKEEP_SOCKET", "/no/such/daemon", 1), 0);
  const ServiceHost host = checkIn(options());
  EXPECT_TRUE(reaches(HostState::kServing));
}

TEST_F(CheckInTest, TheServiceAnswersThePingThatComesBeforeTheAnswerAndServesAfterwards) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kServing));
  EXPECT_EQ(service_->pings, 1);
  EXPECT_EQ(host.status().state, HostState::kServing);
  const auto amount = std::make_shared<std::atomic<std::uint64_t>>(0);
  registered_.get().at(0)->servicePurge(1, {{"SPACEKEEP_AMOUNT", 42}},
                                        [amount](const ipc::OptionalDictionary& reply) {
                                          *amount = unsignedAt(*reply, "SPACEKEEP_AMOUNT").value();
                                        });
  EXPECT_TRUE(eventually([&] { return *amount == 42; }));
}

TEST_F(CheckInTest, TheCheckInTellsWhatTheServiceDoes) {
  rt::Guarded<std::vector<ipc::Arguments>> calls;
  daemon_.on("clientCheckin", [&](const ipc::Arguments& in, const ipc::Responder&) {
    calls.update([&](auto& list) { list.push_back({in.at(0), in.at(2)}); });
  });
  const auto running = daemon_.run();
  auto given = options();
  given.does_purge = false;
  given.does_periodic = true;
  given.notifications = {"one", "two"};
  const ServiceHost host = checkIn(given);
  ASSERT_TRUE(eventually([&] { return !calls.get().empty(); }));
  EXPECT_EQ(std::get<std::string>(calls.get().at(0).at(0)), "org.example.cache");
  EXPECT_EQ(
      std::get<Dictionary>(calls.get().at(0).at(1)),
      (Dictionary{
          {"PURGE", false}, {"PERIODIC", true}, {"SPACEKEEP_NOTIFICATIONS", Array{"one", "two"}}}));
  daemon_.stop();
}

TEST_F(CheckInTest, AfterTheDaemonWentAwayTheServiceChecksInAgainByItself) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kServing));
  daemon_.stop();
  ASSERT_TRUE(reaches(HostState::kWaiting));
  EXPECT_THAT(lastTextOf(HostState::kWaiting), HasSubstr("trying again in "));
  const auto running_again = daemon_.run();
  ASSERT_TRUE(reaches(HostState::kServing, 2));
  ASSERT_EQ(registered_.get().size(), 2U);
  EXPECT_TRUE(pings(*registered_.get().at(1)));
}

TEST_F(CheckInTest, AServiceThatStartsBeforeTheDaemonWaitsForIt) {
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kWaiting));
  EXPECT_THAT(lastTextOf(HostState::kWaiting), HasSubstr(directory_.daemonSocket()));
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  EXPECT_TRUE(reaches(HostState::kServing));
}

TEST_F(CheckInTest, WhenOnlyTheServiceConnectionEndsBothAreMadeAnew) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kServing));
  daemon_.dropServices();
  ASSERT_TRUE(reaches(HostState::kServing, 2));
  EXPECT_TRUE(pings(*registered_.get().at(1)));
}

TEST_F(CheckInTest, ARunningPurgeIsCancelledWhenTheDaemonGoesAway) {
  daemon_.on("clientCheckin", daemon_.registering(registered_));
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kServing));
  service_->holding = true;
  registered_.get().at(0)->servicePurge(1, {}, [](const ipc::OptionalDictionary&) {});
  ASSERT_TRUE(eventually([&] { return service_->inside == 1; }));
  daemon_.stop();
  EXPECT_TRUE(eventually([&] { return service_->cancelled_purges == 1; }));
}

TEST_F(CheckInTest, ADeclaredIdIsRefusedAndNotTriedAgainUntilTheDaemonIsANewOne) {
  std::atomic<int> calls = 0;
  daemon_.on("clientCheckin", [&](const ipc::Arguments&, const ipc::Responder& responder) {
    ++calls;
    responder.reply({ipc::OptionalDictionary(), ipc::OptionalString()});
  });
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kRefused));
  EXPECT_THAT(host.status().text, HasSubstr("\"org.example.cache\""));
  EXPECT_EQ(calls, 1);
  daemon_.stop();
  ASSERT_TRUE(reaches(HostState::kWaiting));
  EXPECT_EQ(calls, 1);
  const auto running_again = daemon_.run();
  EXPECT_TRUE(eventually([&] { return calls == 2; }));
}

TEST_F(CheckInTest, AnErrorInTheAnswerIsToldAndTriedAgain) {
  std::atomic<int> calls = 0;
  const auto good = daemon_.registering(registered_);
  daemon_.on("clientCheckin", [&, good](const ipc::Arguments& in, const ipc::Responder& responder) {
    if (++calls > 1) return good(in, responder);
    responder.reply(
        {ipc::OptionalDictionary(), ipc::OptionalString("no room for another service")});
  });
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kServing));
  EXPECT_THAT(lastTextOf(HostState::kWaiting), HasSubstr("no room for another service"));
}

TEST_F(CheckInTest, ADaemonThatDoesNotAnswerIsReportedAndStillWaitedForWhilePingsAreAnswered) {
  rt::Guarded<std::optional<ipc::Responder>> held;
  std::shared_ptr<SpacekeepServiceProtocol> service;
  std::atomic<bool> arrived = false;
  daemon_.on("clientCheckin", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    service = std::make_shared<SpacekeepServiceProtocol>(
        daemon_.connectTo(std::get<ipc::SharedDescriptor>(in.at(1))));
    held.set(responder);
    arrived = true;
  });
  const auto running = daemon_.run();
  auto given = options();
  given.patience = milliseconds(20);
  const ServiceHost host = checkIn(given);
  ASSERT_TRUE(reaches(HostState::kCheckingIn, 2));
  EXPECT_THAT(host.status().text, HasSubstr("has not answered the check-in yet"));
  ASSERT_TRUE(eventually([&] { return arrived.load(); }));
  EXPECT_TRUE(pings(*service));
  held.get()->reply(
      {ipc::OptionalDictionary(Dictionary{{"SPACEKEEP_ID", "x"}}), ipc::OptionalString()});
  EXPECT_TRUE(reaches(HostState::kServing));
}

TEST_F(CheckInTest, ADaemonThatDropsTheCheckInWithoutAnAnswerIsToldAsAMissingRight) {
  daemon_.on("clientCheckin", [](const ipc::Arguments&, const ipc::Responder&) {});
  const auto running = daemon_.run();
  const ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kWaiting));
  EXPECT_THAT(lastTextOf(HostState::kWaiting), HasSubstr("\"SERVICE_ENTITLEMENT\""));
}

TEST_F(CheckInTest, AStopDuringACheckInLetsTheDaemonFinishItsPing) {
  rt::Guarded<std::optional<ipc::Responder>> held;
  rt::Guarded<std::shared_ptr<SpacekeepServiceProtocol>> service;
  daemon_.on("clientCheckin", [&](const ipc::Arguments& in, const ipc::Responder& responder) {
    service.set(std::make_shared<SpacekeepServiceProtocol>(
        daemon_.connectTo(std::get<ipc::SharedDescriptor>(in.at(1)))));
    held.set(responder);
  });
  const auto running = daemon_.run();
  ServiceHost host = checkIn(options());
  ASSERT_TRUE(eventually([&] { return held.get().has_value(); }));
  host.stop();
  EXPECT_TRUE(pings(*service.get()));
  held.get()->reply(
      {ipc::OptionalDictionary(Dictionary{{"SPACEKEEP_ID", "x"}}), ipc::OptionalString()});
  host.waitUntilStopped();
  EXPECT_EQ(host.status().state, HostState::kStopped);
  EXPECT_TRUE(daemon_.service_errors.get().empty());
}

TEST_F(CheckInTest, AStopWhileTheDaemonStaysSilentEndsAfterAShortGrace) {
  daemon_.on("clientCheckin", [](const ipc::Arguments&, const ipc::Responder&) {});
  const auto running = daemon_.run();
  ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kCheckingIn));
  host.stop();
  host.waitUntilStopped();
  EXPECT_EQ(host.status().state, HostState::kStopped);
}

TEST_F(CheckInTest, StoppingEndsThePauseAndIsTheLastThingReported) {
  ServiceHost host = checkIn(options());
  ASSERT_TRUE(reaches(HostState::kWaiting, 3));
  host.stop();
  host.stop();
  host.waitUntilStopped();
  EXPECT_EQ(history_.get().back().state, HostState::kStopped);
  EXPECT_EQ(timesIn(HostState::kStopped), 1);
}

TEST_F(CheckInTest, AHostMayBeStoppedFromItsOwnStatusHandler) {
  std::optional<ServiceHost> host;
  std::atomic<bool> ready = false;
  auto given = options();
  given.on_status = [&](const HostStatus& status) {
    if (status.state == HostState::kWaiting && ready) host->stop();
  };
  host.emplace(checkIn(given));
  ready = true;
  host->waitUntilStopped();
  EXPECT_EQ(host->status().state, HostState::kStopped);
}

TEST(CheckIn, AnEmptyIdAndAMissingServiceAreErrors) {
  const auto no_id = ServiceHost::checkIn("", std::make_shared<Service>());
  ASSERT_FALSE(no_id);
  EXPECT_EQ(no_id.error().kind, ErrorKind::kInvalidArgument);
  const auto no_service = ServiceHost::checkIn("id", nullptr);
  ASSERT_FALSE(no_service);
  EXPECT_EQ(no_service.error().kind, ErrorKind::kInvalidArgument);
}

}  // namespace
}  // namespace spacekeep::sdk
