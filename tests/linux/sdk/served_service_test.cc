// What a service answers on the wire, over a real socket pair.
#include "sdk/served_service.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>

#include "sdk/engine.h"
#include "tests/linux/sdk/fake_daemon.h"
#include "tests/linux/sdk/test_service.h"

namespace spacekeep::sdk {
namespace {

using testing::ElementsAre;
using testing::HasSubstr;

class ServedServiceTest : public testing::Test {
 protected:
  /// Serves `service` on one end of a socket pair and calls it through the other.
  SpacekeepServiceProtocol serve(std::shared_ptr<Service> service,
                                 Handlers handlers = Handlers::kOneAtATime) {
    served_ = std::make_shared<ServedService>(std::move(service), handlers, engine_.queue);
    server_ = std::make_unique<ipc::BusServer>(engine_.loop, engine_.queue, served_->interface());
    const auto pair = ipc::makeSocketPair();
    server_->serveConnected(pair.first);
    return daemon_.connectTo(pair.second);
  }
  ~ServedServiceTest() override {
    if (served_) served_->cancelAll();
    daemon_.dropServices();
  }

  SocketDirectory directory_;
  Engine engine_;
  std::shared_ptr<ServedService> served_;
  std::unique_ptr<ipc::BusServer> server_;
  FakeDaemon daemon_{directory_.daemonSocket()};
};

/// Keeps the answer of one call.
struct Answered {
  [[nodiscard]] auto taker() const {
    return [slot = slot](ipc::OptionalDictionary reply) { slot->set(std::move(reply)); };
  }
  [[nodiscard]] bool arrived() const { return slot->get().has_value(); }
  [[nodiscard]] ipc::OptionalDictionary wait() const {
    EXPECT_TRUE(eventually([this] { return arrived(); }));
    return slot->get().value_or(std::nullopt);
  }
  std::shared_ptr<rt::Guarded<std::optional<ipc::OptionalDictionary>>> slot =
      std::make_shared<rt::Guarded<std::optional<ipc::OptionalDictionary>>>();
};

void waitForEmpty(const std::function<void(SpacekeepServiceProtocol::EmptyReply)>& call) {
  CountingSemaphore done(0);
  call([&done] { done.signal(); });
  EXPECT_EQ(done.waitForNs(20'000'000'000), WaitResult::kSignalled);
}

TEST_F(ServedServiceTest, AServiceThatOverridesNothingAnswersEverythingSanely) {
  const auto proxy = serve(std::make_shared<Service>());
  const Dictionary info{{"SPACEKEEP_VOLUME", "/"}};
  const Dictionary nothing{{"SPACEKEEP_AMOUNT", 0}};
  const Answered purgeable, purge, periodic, callback;
  proxy.servicePurgeable(1, info, purgeable.taker());
  proxy.servicePurge(1, info, purge.taker());
  proxy.servicePeriodic(1, info, periodic.taker());
  proxy.serviceCallback(info, callback.taker());
  EXPECT_EQ(purgeable.wait(), nothing);
  EXPECT_EQ(purge.wait(), nothing);
  EXPECT_EQ(periodic.wait(), nothing);
  EXPECT_EQ(callback.wait(), std::nullopt);
  waitForEmpty([&](auto reply) { proxy.servicePing(reply); });
  waitForEmpty([&](auto reply) { proxy.serviceCancelPurge(reply); });
  waitForEmpty([&](auto reply) { proxy.serviceNotify({{"name", 1}}, reply); });
}

TEST_F(ServedServiceTest, AJobCarriesVolumeAmountUrgencyAndTheWholeRequest) {
  const auto service = std::make_shared<TestService>();
  const auto proxy = serve(service);
  const Dictionary info{
      {"SPACEKEEP_VOLUME", "/data"}, {"SPACEKEEP_AMOUNT", 5'000'000'000}, {"x", 1}};
  const Answered answer;
  proxy.servicePurge(3, info, answer.taker());
  EXPECT_EQ(answer.wait(), (Dictionary{{"SPACEKEEP_AMOUNT", 5'000'000'000}}));
  const Job job = service->last_job.get();
  EXPECT_EQ(job.volume, "/data");
  EXPECT_EQ(job.amount, 5'000'000'000U);
  EXPECT_EQ(job.urgency, 3);
  EXPECT_EQ(job.info, info);
  EXPECT_FALSE(job.cancellation.cancelled());
}

TEST_F(ServedServiceTest, ARequestWithoutVolumeOrWithAnAmountThatIsNoNumberStillReachesTheHandler) {
  const auto service = std::make_shared<TestService>();
  const auto proxy = serve(service);
  const Answered answer;
  proxy.servicePurge(1, {{"SPACEKEEP_AMOUNT", "many"}, {"SPACEKEEP_VOLUME", 3}}, answer.taker());
  EXPECT_EQ(answer.wait(), (Dictionary{{"SPACEKEEP_AMOUNT", 0}}));
  EXPECT_EQ(service->last_job.get().volume, "");
}

TEST_F(ServedServiceTest, FurtherKeysOfAnAnswerTravelAndTheAmountWins) {
  const auto proxy = serve(std::make_shared<TestService>());
  const Answered answer;
  proxy.servicePurgeable(1, {}, answer.taker());
  EXPECT_EQ(answer.wait(), (Dictionary{{"SPACEKEEP_AMOUNT", 1000}, {"note", "cached"}}));
}

TEST_F(ServedServiceTest, ANotificationArrivesByNameAndValue) {
  const auto service = std::make_shared<TestService>();
  const auto proxy = serve(service);
  waitForEmpty([&](auto reply) { proxy.serviceNotify({{"LOW", Array{1, 2}}}, reply); });
  EXPECT_THAT(service->notes.get(), ElementsAre(Dictionary::Entry{"LOW", Array{1, 2}}));
}

TEST_F(ServedServiceTest, PingsAndCancelRequestsAreAnsweredWhileAPurgeRuns) {
  const auto service = std::make_shared<TestService>();
  service->holding = true;
  const auto proxy = serve(service);
  const Answered purge;
  proxy.servicePurge(2, {{"SPACEKEEP_AMOUNT", 9}}, purge.taker());
  ASSERT_TRUE(eventually([&] { return service->inside == 1; }));
  waitForEmpty([&](auto reply) { proxy.servicePing(reply); });
  EXPECT_EQ(service->pings, 1);
  EXPECT_FALSE(purge.arrived());
  waitForEmpty([&](auto reply) { proxy.serviceCancelPurge(reply); });
  EXPECT_EQ(purge.wait(), (Dictionary{{"SPACEKEEP_AMOUNT", 9}}));
  EXPECT_EQ(service->cancelled_purges, 1);
  EXPECT_EQ(service->cancel_requests, 1);
}

TEST_F(ServedServiceTest, ACancelRequestAlsoReachesAPurgeThatWaitsForItsTurnButNoLaterOne) {
  const auto service = std::make_shared<TestService>();
  service->holding = true;
  const auto proxy = serve(service);
  const Answered first, second, third;
  proxy.servicePurge(1, {}, first.taker());
  proxy.servicePurge(2, {}, second.taker());
  ASSERT_TRUE(eventually([&] { return served_->activity().pending == 2; }));
  waitForEmpty([&](auto reply) { proxy.serviceCancelPurge(reply); });
  EXPECT_TRUE(first.wait());
  EXPECT_TRUE(second.wait());
  EXPECT_EQ(service->cancelled_purges, 2);
  service->holding = false;
  proxy.servicePurge(1, {}, third.taker());
  EXPECT_TRUE(third.wait());
  EXPECT_FALSE(service->last_job.get().cancellation.cancelled());
}

TEST_F(ServedServiceTest, OneAtATimeAQueryWaitsForThePurge) {
  const auto service = std::make_shared<TestService>();
  service->holding = true;
  const auto proxy = serve(service, Handlers::kOneAtATime);
  const Answered purge, query;
  proxy.servicePurge(1, {}, purge.taker());
  proxy.servicePurgeable(1, {}, query.taker());
  ASSERT_TRUE(eventually([&] { return served_->activity().pending == 2; }));
  waitForEmpty([&](auto reply) { proxy.servicePing(reply); });
  EXPECT_FALSE(query.arrived());
  waitForEmpty([&](auto reply) { proxy.serviceCancelPurge(reply); });
  EXPECT_TRUE(query.wait());
  EXPECT_EQ(service->most_inside, 1);
}

TEST_F(ServedServiceTest, SideBySideAQueryIsAnsweredWhileAPurgeRunsAndTwoPurgesStillTakeTurns) {
  const auto service = std::make_shared<TestService>();
  service->holding = true;
  const auto proxy = serve(service, Handlers::kSideBySide);
  const Answered first, second, query;
  proxy.servicePurge(1, {}, first.taker());
  proxy.servicePurge(1, {}, second.taker());
  proxy.servicePurgeable(1, {}, query.taker());
  EXPECT_TRUE(query.wait());
  EXPECT_FALSE(first.arrived());
  EXPECT_EQ(service->purges, 1);
  waitForEmpty([&](auto reply) { proxy.serviceCancelPurge(reply); });
  EXPECT_TRUE(first.wait());
  EXPECT_TRUE(second.wait());
}

TEST_F(ServedServiceTest, AHandlerThatThrowsFailsItsCallAndTheServiceGoesOn) {
  const auto service = std::make_shared<TestService>();
  service->throwing = true;
  const auto proxy = serve(service);
  proxy.servicePurge(1, {},
                     [](const ipc::OptionalDictionary&) { ADD_FAILURE() << "was answered"; });
  ASSERT_TRUE(eventually([&] { return !daemon_.service_errors.get().empty(); }));
  EXPECT_THAT(daemon_.service_errors.get(), ElementsAre(HasSubstr("the disk is on fire")));
  service->throwing = false;
  const Answered next;
  proxy.servicePurge(1, {}, next.taker());
  EXPECT_TRUE(next.wait());
}

TEST(Cancellation, CopiesShareOneStateAndAWaitEndsWithIt) {
  const Cancellation cancellation;
  const Cancellation copy = cancellation;
  EXPECT_FALSE(copy.waitFor(std::chrono::milliseconds(1)));
  EXPECT_FALSE(copy.waitFor(std::chrono::milliseconds(-5)));
  rt::Thread other("cancels", [cancellation] { cancellation.cancel(); });
  EXPECT_TRUE(copy.waitFor(std::chrono::milliseconds::max()));
  EXPECT_TRUE(copy.cancelled());
  other.join();
  EXPECT_FALSE(Cancellation().cancelled());
}

}  // namespace
}  // namespace spacekeep::sdk
