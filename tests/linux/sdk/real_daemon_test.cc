// Clients and services of the library against the daemon object itself.
#include "tests/linux/sdk/real_daemon.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <spacekeep/client.h>
#include <spacekeep/service.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

namespace spacekeep::sdk {
namespace {

using testing::HasSubstr;

/// Frees what it is asked for from a store of its own.
class Cache : public Service {
 public:
  Cache(OneVolume& volume, std::uint64_t stored) : volume_(volume), stored_(stored) {}

  Answer purge(const Job& job) override {
    std::uint64_t stored = stored_;
    const std::uint64_t given = std::min(stored, job.amount);
    stored_ -= given;
    volume_.free_bytes += given;
    return {.amount = given, .more = {}};
  }
  void pinged() override { ++pings; }

  std::atomic<int> pings = 0;

 private:
  OneVolume& volume_;
  std::atomic<std::uint64_t> stored_;
};

class WithRealDaemon : public testing::Test {
 protected:
  ServiceHost checkIn(const std::string& id, std::shared_ptr<Service> service) {
    CheckInOptions options;
    options.socket_path = directory_.daemonSocket();
    auto host = ServiceHost::checkIn(id, std::move(service), options);
    EXPECT_TRUE(host);
    return std::move(*host);
  }
  static bool serves(const ServiceHost& host) {
    return eventually([&] { return host.status().state == HostState::kServing; });
  }
  Client connect() {
    auto client = Client::connect({directory_.daemonSocket(), {}});
    EXPECT_TRUE(client) << client.error().text;
    return std::move(*client);
  }

  SocketDirectory directory_;
  RealDaemon daemon_{directory_.daemonSocket()};
};

TEST_F(WithRealDaemon, TwoServicesShareAPurgeAndTheSpaceIsThere) {
  const auto photos = std::make_shared<Cache>(daemon_.volumes, 10'000);
  const auto maps = std::make_shared<Cache>(daemon_.volumes, 10'000);
  const ServiceHost first = checkIn("photos", photos);
  const ServiceHost second = checkIn("maps", maps);
  ASSERT_TRUE(serves(first) && serves(second));
  EXPECT_EQ(photos->pings, 1);
  Client client = connect();
  PurgeRequest request;
  request.volume = "/data";
  request.amount = 5000;
  request.urgency = 1;
  request.finish_early = true;
  const Reply reply = client.purge(request);
  ASSERT_TRUE(reply.outcome) << (reply.error ? reply.error->text : "refused");
  EXPECT_GE(unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value(), 5000U);
  EXPECT_EQ(unsignedAt(*reply.outcome, "SPACEKEEP_FREESPACE_BEGIN"), 1000U);
  EXPECT_EQ(daemon_.volumes.free_bytes,
            1000 + unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value());
  const auto* record = reply.outcome->find("SPACEKEEP_URGENCY_1_OPERATION_INFO");
  ASSERT_NE(record, nullptr);
  const auto* reporting = record->dictionary()->find("SPACEKEEP_REPORTING_SERVICES");
  ASSERT_NE(reporting, nullptr);
  EXPECT_TRUE(reporting->dictionary()->contains("photos"));
  EXPECT_TRUE(reporting->dictionary()->contains("maps"));
}

TEST_F(WithRealDaemon, AServiceThatStopsIsTakenOutOfTheRegistryAndMayComeBack) {
  {
    const ServiceHost host = checkIn("photos", std::make_shared<Cache>(daemon_.volumes, 1));
    ASSERT_TRUE(serves(host));
    EXPECT_EQ(daemon_.serviceCount(), 1U);
  }
  EXPECT_TRUE(eventually([&] { return daemon_.serviceCount() == 0; }));
  const auto again = std::make_shared<Cache>(daemon_.volumes, 1);
  const ServiceHost host = checkIn("photos", again);
  ASSERT_TRUE(serves(host));
  EXPECT_EQ(daemon_.serviceCount(), 1U);
  EXPECT_EQ(again->pings, 1);
}

TEST_F(WithRealDaemon, ASecondHostUnderTheSameIdGetsItsTurnOnceTheFirstIsGone) {
  const auto late = std::make_shared<Cache>(daemon_.volumes, 1);
  std::optional<ServiceHost> first(checkIn("photos", std::make_shared<Cache>(daemon_.volumes, 1)));
  ASSERT_TRUE(serves(*first));
  const ServiceHost second = checkIn("photos", late);
  // The daemon keeps the first connection and drops the second one's endpoint.
  ASSERT_TRUE(eventually([&] { return second.status().state == HostState::kWaiting; }));
  EXPECT_EQ(late->pings, 0);
  first.reset();
  EXPECT_TRUE(eventually([&] { return late->pings == 1; }));
  EXPECT_TRUE(serves(second));
}

TEST_F(WithRealDaemon, WithoutThePurgeRightTheAnswerIsARefusal) {
  daemon_.access.denied.set("PURGE_ENTITLEMENT");
  Client client = connect();
  PurgeRequest request;
  request.volume = "/data";
  request.amount = 1;
  EXPECT_TRUE(client.purge(request).refused());
}

TEST_F(WithRealDaemon, AnUnknownVolumeIsARefusal) {
  Client client = connect();
  PurgeRequest request;
  request.volume = "/elsewhere";
  request.amount = 1;
  EXPECT_TRUE(client.purge(request).refused());
}

TEST_F(WithRealDaemon, WithoutTheClientRightTheFirstCallTellsIt) {
  daemon_.access.denied.set("CLIENT_ENTITLEMENT");
  Client client = connect();
  const Reply reply = client.purge({});
  ASSERT_TRUE(reply.error);
  EXPECT_EQ(reply.error->kind, ErrorKind::kNotAllowed);
}

TEST_F(WithRealDaemon, WithoutTheServiceRightTheHostSaysSoAndKeepsTrying) {
  daemon_.access.denied.set("SERVICE_ENTITLEMENT");
  const ServiceHost host = checkIn("photos", std::make_shared<Cache>(daemon_.volumes, 1));
  ASSERT_TRUE(eventually([&] { return host.status().state == HostState::kWaiting; }));
  EXPECT_THAT(host.status().text, HasSubstr("\"SERVICE_ENTITLEMENT\""));
  daemon_.access.denied.set("");
  EXPECT_TRUE(serves(host));
}

TEST_F(WithRealDaemon, ACancelRequestIsAnswered) {
  Client client = connect();
  EXPECT_TRUE(client.cancel(Value("no such purge")).ok());
}

}  // namespace
}  // namespace spacekeep::sdk
