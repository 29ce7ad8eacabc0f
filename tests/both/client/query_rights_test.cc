// Who may ask what could be freed, and what a refusal looks like.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

const Dictionary kRoot{{keys::kVolume, "/"}};

/// A call by a client that holds `held` alone. It must be answered without a dictionary, and
/// without anybody having been asked.
void expectRefused(const char* member, const char* held) {
  inEverySchedule(kSchedules, [&] {
    StateWorld world;
    const auto cache = world.world.declareService("cache", sim::ownsBytes("/", 5));
    world.start();
    const auto call = world.world.call(world.world.client("c", {held}), member, {kRoot});
    EXPECT_EQ(call->wait(), std::nullopt);
    EXPECT_EQ(call->state(), CallState::kAnswered);
    EXPECT_EQ(call->answers(), 1U);
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{std::string(member) + " Connection is not entitled!"});
    EXPECT_EQ(world.lines("%s ENTRY, info: %@"), 0U);
    EXPECT_TRUE(cache->calls().empty());
  });
}

TEST(ClientQueryRights, ToAskInTotalDoesNotCoverTheItemizedQuery) {
  expectRefused("clientItemizedPurgeableSpace", "PURGEABLE_ENTITLEMENT");
}

TEST(ClientQueryRights, ToAskItemizedDoesNotCoverTheQueryInTotal) {
  expectRefused("clientPurgeableSpace", "ITEMIZED_PURGEABLE_ENTITLEMENT");
}

TEST(ClientQueryRights, ToPurgeCoversNeitherQuery) {
  expectRefused("clientPurgeableSpace", "PURGE_ENTITLEMENT");
  expectRefused("clientItemizedPurgeableSpace", "PURGE_ENTITLEMENT");
}

TEST(ClientQueryRights, ToQueryDoesNotCoverPurges) {
  expectRefused("clientPurge", "PURGEABLE_ENTITLEMENT");
  expectRefused("clientPurge", "ITEMIZED_PURGEABLE_ENTITLEMENT");
}

TEST(ClientQueryRights, EachQueryNeedsItsOwnRightAlone) {
  for (const auto& [member, held] :
       {std::pair("clientPurgeableSpace", "PURGEABLE_ENTITLEMENT"),
        std::pair("clientItemizedPurgeableSpace", "ITEMIZED_PURGEABLE_ENTITLEMENT")}) {
    inEverySchedule(kSchedules, [&, member = member, held = held] {
      StateWorld world;
      world.start();
      world.setSync(shared(recordOf("/", "cache", 5)), keys::kRecentServiceStats);
      const auto call = world.world.call(world.world.client("c", {held}), member, {kRoot});
      EXPECT_EQ(
          call->wait(),
          (Dictionary{{"SPACEKEEP_TOTAL_AVAILABLE", 5}, {"SPACEKEEP_VOLUME", "/"}, {"cache", 5}}));
      EXPECT_TRUE(world.problems().empty());
    });
  }
}

TEST(ClientQueryRights, ARequestThatTheOperationRefusesIsAnsweredWithNothing) {
  for (const Dictionary& info : {Dictionary{}, Dictionary{{keys::kVolume, "/gone"}}}) {
    inEverySchedule(kSchedules, [&] {
      StateWorld world;
      world.start();
      const auto client = world.world.client("c", {"PURGEABLE_ENTITLEMENT"});
      const auto call = world.world.call(client, "clientPurgeableSpace", {info});
      EXPECT_EQ(call->wait(), std::nullopt);
      EXPECT_EQ(call->state(), CallState::kAnswered);
      EXPECT_EQ(world.problems().size(), 1U);
    });
  }
}

TEST(ClientQueryRights, TheReplyRunsOnAnotherThreadThanTheServingOneWithTheRightAndWithout) {
  using Entry = void (Spacekeep::*)(Dictionary, Spacekeep::DictionaryReply);
  struct Case {
    Entry entry;
    const char* held;
    bool is_entitled;
  };
  for (const Case& at :
       {Case{&Spacekeep::clientPurgeableSpace, "nothing", false},
        Case{&Spacekeep::clientPurgeableSpace, "PURGEABLE_ENTITLEMENT", true},
        Case{&Spacekeep::clientItemizedPurgeableSpace, "ITEMIZED_PURGEABLE_ENTITLEMENT", true}}) {
    inEverySchedule(kSchedules, [&] {
      StateWorld world;
      world.start();
      const auto is_serving = std::make_shared<rt::Guarded<std::optional<bool>>>();
      const auto peer = world.world.client("asker", {at.held});
      const ipc::ServingScope scope(peer.get());
      // The mark is in the serving thread's own storage: the reply must not see it.
      (*world.daemon.*at.entry)(kRoot, [&at, is_serving](const ipc::OptionalDictionary& answer) {
        EXPECT_EQ(answer.has_value(), at.is_entitled);
        is_serving->set(ipc::currentConnection() != nullptr);
      });
      EXPECT_TRUE(world.eventually([&] { return is_serving->get().has_value(); }));
      EXPECT_EQ(is_serving->get(), false);
    });
  }
}

}  // namespace
}  // namespace spacekeep::test
