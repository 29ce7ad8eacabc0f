// The program as a service: asked over the wire by checking in, and at a handed-over socket.
#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>
#include <limits>

#include "tests/linux/cachedir/cache_world.h"
#include "tests/linux/cachedir/program_world.h"
#include "tests/linux/sdk/fake_daemon.h"

namespace spacekeep::cachedir {
namespace {

using sdk::eventually;

constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max();

/// The reply of one call.
class Reply {
 public:
  SpacekeepServiceProtocol::DictionaryReply taker() {
    return [slot = slot_](ipc::OptionalDictionary reply) { slot->set(std::move(reply)); };
  }
  [[nodiscard]] bool arrived() const { return slot_->get().has_value(); }
  [[nodiscard]] std::uint64_t amount() const {
    EXPECT_TRUE(eventually([this] { return arrived(); }));
    const auto reply = slot_->get().value_or(std::nullopt);
    EXPECT_TRUE(reply && reply->contains("SPACEKEEP_AMOUNT"));
    return reply ? unsignedAt(*reply, "SPACEKEEP_AMOUNT").value_or(kMost) : kMost;
  }

 private:
  std::shared_ptr<rt::Guarded<std::optional<ipc::OptionalDictionary>>> slot_ =
      std::make_shared<rt::Guarded<std::optional<ipc::OptionalDictionary>>>();
};

class Serving : public testing::Test {
 protected:
  std::uint64_t purge(const SpacekeepServiceProtocol& service, int urgency, std::uint64_t amount,
                      const std::string& volume) {
    Reply reply;
    service.servicePurge(urgency, {{"SPACEKEEP_VOLUME", volume}, {"SPACEKEEP_AMOUNT", amount}},
                         reply.taker());
    return reply.amount();
  }
  std::uint64_t purgeable(const SpacekeepServiceProtocol& service, int urgency) {
    Reply reply;
    service.servicePurgeable(urgency, {{"SPACEKEEP_VOLUME", volume_.path()}}, reply.taker());
    return reply.amount();
  }
  [[nodiscard]] std::shared_ptr<SpacekeepServiceProtocol> checkedIn() {
    daemon_.on("clientCheckin", daemon_.registering(services_));
    daemon_.start();
    program_ = std::make_unique<Program>(std::vector<std::string>{
        "--rules", rules_, "--check-in", "--socket", sockets_.daemonSocket()});
    EXPECT_TRUE(eventually([this] { return !services_.get().empty(); })) << program_->errSoFar();
    return services_.get().empty() ? nullptr : services_.get().front();
  }

  Volume volume_{"ext4"};
  const std::string cache_ = volume_ / "cache";
  const std::string rules_ = ruleFileFor(cache_);
  sdk::SocketDirectory sockets_;
  rt::Guarded<std::vector<std::shared_ptr<SpacekeepServiceProtocol>>> services_;
  sdk::FakeDaemon daemon_{sockets_.daemonSocket()};
  std::unique_ptr<Program> program_;
};

TEST_F(Serving, ACheckedInServiceFreesWhatItSaysOnTheVolumeAsked) {
  for (int i = 1; i <= 5; ++i) writeFile(cache_ + "/f" + std::to_string(i), kMiB, 10.5 * i);
  volume_.settle();
  const auto service = checkedIn();
  ASSERT_NE(service, nullptr);
  EXPECT_EQ(purgeable(*service, 1), 3 * kMiB);
  EXPECT_EQ(purgeable(*service, 2), 5 * kMiB);
  EXPECT_EQ(purge(*service, 1, 0, volume_.path()), 0U);
  EXPECT_EQ(purge(*service, 1, kMiB, "/"), 0U);
  EXPECT_EQ(purge(*service, 1, kMiB, ""), 0U);
  EXPECT_EQ(purge(*service, 0, kMiB, volume_.path()), 0U);
  const std::uint64_t before = volume_.freeBytes();
  EXPECT_EQ(purge(*service, 1, kMiB + 1, volume_.path()), 2 * kMiB);
  EXPECT_EQ(volume_.freeBytes() - before, 2 * kMiB);
  EXPECT_FALSE(exists(cache_ + "/f5"));
  EXPECT_FALSE(exists(cache_ + "/f4"));
  EXPECT_TRUE(exists(cache_ + "/f3"));
  EXPECT_EQ(purgeable(*service, 1), kMiB);
  program_->signal(SIGTERM);
  EXPECT_EQ(program_->wait().status, 0);
}

TEST_F(Serving, ACancelEndsThePurgeWhichAnswersWhatItFreed) {
  constexpr int kFiles = 30000;
  for (int i = 0; i < kFiles; ++i) {
    writeFile(cache_ + "/d" + std::to_string(i % 30) + "/f" + std::to_string(i), 4096);
  }
  volume_.settle();
  const auto service = checkedIn();
  ASSERT_NE(service, nullptr);
  const std::uint64_t before = volume_.freeBytes();
  Reply reply;
  service->servicePurge(4, {{"SPACEKEEP_VOLUME", volume_.path()}, {"SPACEKEEP_AMOUNT", kMost}},
                        reply.taker());
  ASSERT_TRUE(eventually([&] { return volume_.freeBytes() > before; }));
  service->serviceCancelPurge([] {});
  const std::uint64_t freed = reply.amount();
  EXPECT_GT(freed, 0U);
  EXPECT_LT(freed, kFiles * 4096U);
  EXPECT_EQ(volume_.freeBytes() - before, freed);
  EXPECT_EQ(purgeable(*service, 4), kFiles * 4096U - freed);
}

TEST_F(Serving, TheDailyPassIsServed) {
  writeFile(cache_ + "/old", kMiB, 100);
  volume_.settle();
  const auto service = checkedIn();
  ASSERT_NE(service, nullptr);
  Reply reply;
  service->servicePeriodic(3, {{"SPACEKEEP_VOLUME", volume_.path()}}, reply.taker());
  EXPECT_EQ(reply.amount(), 0U) << "no span for the daily pass is set";
}

TEST_F(Serving, AServiceAtAHandedOverSocketServesAndEndsWhenIdle) {
  writeFile(cache_ + "/f", kMiB, 100);
  volume_.settle();
  std::string why;
  const auto listening = ipc::bindListeningSocket(sockets_.serviceSocket(), 0600, why);
  ASSERT_NE(listening, nullptr) << why;
  Program program({"--rules", rules_, "--stop-when-idle", "2"}, listening->fd());
  const auto connected = ipc::connectSocket(sockets_.serviceSocket(), why);
  ASSERT_NE(connected, nullptr) << why;
  const SpacekeepServiceProtocol service = daemon_.connectTo(connected);
  EXPECT_EQ(purgeable(service, 1), kMiB);
  EXPECT_EQ(purge(service, 1, kMiB, volume_.path()), kMiB);
  EXPECT_FALSE(exists(cache_ + "/f"));
  EXPECT_EQ(program.wait().status, 0);
}

}  // namespace
}  // namespace spacekeep::cachedir
