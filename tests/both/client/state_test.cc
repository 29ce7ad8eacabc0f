// What clients keep in the daemon: set, get, defaults, failures.
#include <gtest/gtest.h>

#include "tests/both/client/state_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

using CallState = sim::ClientCall::State;

TEST(ClientState, WhatWasSetIsReadAndWhatWasTakenAwayIsTheDefaultOrNothing) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.daemon->setDefault_values({{"with default", "built in"}});
    for (const char* key : {"with default", "without"}) {
      EXPECT_TRUE(world.set(key, Value(1)));
      EXPECT_EQ(world.get(key), Value(1));
      EXPECT_TRUE(world.set(key, std::nullopt));
      EXPECT_FALSE(world.onDisk(key).has_value());
    }
    EXPECT_EQ(world.get("with default"), Value("built in"));
    EXPECT_EQ(world.get("without"), std::nullopt);
  });
}

TEST(ClientState, TheWholeStateComesWithTheDefaultsItDoesNotHoldAndTheyAreNotWrittenBack) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.daemon->setDefault_values({{"k1", 2}, {"k2", 3}});
    EXPECT_TRUE(world.set("k1", Value(1)));
    EXPECT_EQ(world.get("SPACEKEEP_USER_DEFAULTS"), Value(Dictionary{{"k1", 1}, {"k2", 3}}));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"k1", 1}}));
    EXPECT_TRUE(world.set("k3", Value(4)));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"k1", 1}, {"k3", 4}}));
  });
}

TEST(ClientState, WithoutAnyStateTheDefaultIsAnsweredWithoutALine) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_EQ(world.get("SPACEKEEP_CACHE_ENABLED"), Value(true));
    EXPECT_EQ(world.get("unknown"), std::nullopt);
    // Without a state the key of the whole is a key like any other.
    EXPECT_EQ(world.get("SPACEKEEP_USER_DEFAULTS"), std::nullopt);
    EXPECT_EQ(world.lines("%s using default value: %@ for key: %@"), 0U);
    EXPECT_TRUE(world.problems().empty());
    EXPECT_FALSE(world.stateOnDisk().has_value());
  });
}

TEST(ClientState, BesideAStateADefaultIsAnsweredWithItsLine) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{"other", 1}});
    world.start();
    EXPECT_EQ(world.get("SPACEKEEP_CACHE_ENABLED"), Value(true));
    EXPECT_EQ(world.get("unknown"), std::nullopt);
    EXPECT_EQ(world.world.trace().linesWithFormat("%s using default value: %@ for key: %@"),
              std::vector<std::string>{
                  "_clientGetState using default value: true for key: SPACEKEEP_CACHE_ENABLED"});
    world.daemon->defaults_queue()->sync([] {});  // the last lines come after the reply
    EXPECT_EQ(std::ranges::count(world.traces(), "_clientGetState ENTRY"), 2);
    EXPECT_EQ(std::ranges::count(world.traces(), "_clientGetState EXIT"), 2);
  });
}

TEST(ClientState, AStoredStateThatIsNoDictionaryAnswersNothingAndSaysSo) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Array{"no", "dictionary"});
    world.start();
    const std::string line =
        "_clientGetState persistent_state is not a dictionary: [\"no\", \"dictionary\"]";
    for (const char* key : {"SPACEKEEP_CACHE_ENABLED", "unknown", "SPACEKEEP_USER_DEFAULTS"}) {
      EXPECT_EQ(world.get(key), std::nullopt) << key;
    }
    EXPECT_EQ(world.problems(), std::vector<std::string>(3, line));
  });
}

TEST(ClientState, AStoredStateThatIsNoDictionaryIsReplacedByTheFirstSet) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk("no dictionary");
    world.start();
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"key", 1}}));
    EXPECT_EQ(world.get("key"), Value(1));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(ClientState, AKeyThatIsNoStringFindsNothingAndIsAProblem) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.putOnDisk(Dictionary{{"7", "seven"}});
    world.start();
    unsigned replies = 0;
    const auto before = world.traces().size();
    world.daemon->defaults_queue()->sync([&] {
      world.daemon->_clientGetState(Value(7), [&](ipc::OptionalValue value) {
        EXPECT_EQ(value, std::nullopt);
        ++replies;
      });
    });
    EXPECT_EQ(replies, 1U);
    EXPECT_EQ(world.problems(), std::vector<std::string>{"_clientGetState key is not a string: 7"});
    const auto traces = world.traces();
    EXPECT_EQ(std::vector<std::string>(traces.begin() + static_cast<std::ptrdiff_t>(before),
                                       traces.end()),
              (std::vector<std::string>{"_clientGetState ENTRY", "_clientGetState EXIT"}));
  });
}

TEST(ClientState, SettingWhetherToCacheTellsTheServicesThatWantToKnow) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    const auto wants = world.world.declareService(
        "wants", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED"}}});
    const auto other =
        world.world.declareService("other", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"news"}}});
    world.start();
    EXPECT_TRUE(world.set("SPACEKEEP_CACHE_ENABLED", Value(false)));
    EXPECT_TRUE(world.eventually([&] { return wants->callCount("serviceNotify") == 1; }));
    EXPECT_EQ(wants->callsOf("serviceNotify").front().info,
              (Dictionary{{"SPACEKEEP_CACHE_ENABLED", false}}));
    EXPECT_TRUE(other->calls().empty());
    EXPECT_TRUE(world.world.trace().hasLine(
        "notifyRecipients name: SPACEKEEP_CACHE_ENABLED, value: false"));
  });
}

TEST(ClientState, TakingAwayWhetherToCacheTellsThemTheBuiltInValue) {
  for (const bool by_the_daemon : {false, true}) {
    inEverySchedule(kSchedules, [by_the_daemon] {
      StateWorld world;
      const auto wants = world.world.declareService(
          "wants", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED"}}});
      world.putOnDisk(Dictionary{{"SPACEKEEP_CACHE_ENABLED", false}});
      world.start();
      if (by_the_daemon) {
        world.setSync({}, "SPACEKEEP_CACHE_ENABLED");
      } else {
        EXPECT_TRUE(world.set("SPACEKEEP_CACHE_ENABLED", std::nullopt));
      }
      EXPECT_TRUE(world.eventually([&] { return wants->callCount("serviceNotify") == 1; }));
      EXPECT_EQ(wants->callsOf("serviceNotify").front().info,
                (Dictionary{{"SPACEKEEP_CACHE_ENABLED", true}}));
      EXPECT_EQ(
          world.world.trace().linesWithFormat("%s name: %@, value: %@"),
          std::vector<std::string>{"notifyRecipients name: SPACEKEEP_CACHE_ENABLED, value: true"});
    });
  }
}

TEST(ClientState, TheServicesAreToldOfASettingBeforeItIsAnswered) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const auto told = std::make_shared<rt::Guarded<std::optional<bool>>>();
    world.daemon->clientSetState(
        Value(false), "SPACEKEEP_CACHE_ENABLED",
        [&world, told] {
          told->set(world.world.trace().hasLine(
              "notifyRecipients name: SPACEKEEP_CACHE_ENABLED, value: false"));
        },
        [](const std::string& why) { ADD_FAILURE() << why; });
    EXPECT_TRUE(world.eventually([&] { return told->get().has_value(); }));
    EXPECT_EQ(told->get(), true);
  });
}

TEST(ClientState, SettingAnyOtherKeyTellsNobody) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    const auto wants = world.world.declareService(
        "wants", {}, {{"SPACEKEEP_NOTIFICATIONS", Array{"SPACEKEEP_CACHE_ENABLED", "key"}}});
    world.start();
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_TRUE(world.set("key", std::nullopt));
    EXPECT_TRUE(world.set("SPACEKEEP_FINISH_EARLY", Value(true)));
    world.world.shutDown();
    EXPECT_TRUE(wants->calls().empty());
    EXPECT_EQ(world.lines("%s name: %@, value: %@"), 0U);
  });
}

TEST(ClientState, IsOnTheDiskWhenTheSetIsAnswered) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const auto seen = std::make_shared<rt::Guarded<std::optional<Value>>>();
    CountingSemaphore answered{0};
    world.daemon->clientSetState(
        Value("kept"), "key",
        [&] {
          seen->set(world.onDisk("key"));
          answered.signal();
        },
        [](const std::string& why) { ADD_FAILURE() << why; });
    answered.wait();
    EXPECT_EQ(seen->get(), Value("kept"));
  });
}

TEST(ClientState, ValuesOfEveryKindComeBackAsTheyWent) {
  inEverySchedule(4, [] {
    StateWorld world;
    world.start();
    const Value values[] = {true,
                            -1,
                            UINT64_MAX,
                            0.5,
                            "text",
                            Data{{1, 2, 3}},
                            Date{1'700'000'000'000'000'000},
                            Array{1, "two", Array{}},
                            Dictionary{{"inner", Dictionary{{"deep", 1}}}}};
    for (const Value& value : values) {
      EXPECT_TRUE(world.set("key", value));
      EXPECT_EQ(world.get("key"), value);
    }
  });
}

TEST(ClientState, OneClientReadsWhatItSetBeforeWithoutWaitingForTheAnswer) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    const auto set =
        world.world.call(world.client, "clientSetState", {ipc::OptionalValue(1), std::string("k")});
    const auto get = world.world.call(world.client, "clientGetState", {std::string("k")});
    get->wait();
    EXPECT_EQ(std::get<ipc::OptionalValue>(get->answer().at(0)), Value(1));
    EXPECT_EQ(set->state(), CallState::kAnswered);
  });
}

TEST(ClientState, NeedsNoRightBeyondTheConnection) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    world.client = world.world.client("nobody");
    EXPECT_TRUE(world.set("key", Value(1)));
    EXPECT_EQ(world.get("key"), Value(1));
    EXPECT_TRUE(world.problems().empty());
  });
}

TEST(ClientState, ManyClientsSettingAtOnceLoseNothing) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    std::vector<std::shared_ptr<sim::ClientCall>> calls;
    for (int i = 0; i < 8; ++i) {
      const std::string name = std::to_string(i);
      calls.push_back(world.world.call(world.world.client(name), "clientSetState",
                                       {ipc::OptionalValue(i), name}));
    }
    for (const auto& call : calls) call->wait();
    const auto state = world.stateOnDisk();
    ASSERT_TRUE(state.has_value());
    EXPECT_EQ(state->dictionary()->size(), 8U);
  });
}

TEST(ClientState, WhatStandsOnTheDiskIsReadAgainForEveryGetAndSet) {
  inEverySchedule(kSchedules, [] {
    StateWorld world;
    world.start();
    EXPECT_TRUE(world.set("key", Value(1)));
    world.putOnDisk(Dictionary{{"key", 2}});
    EXPECT_EQ(world.get("key"), Value(2));
    world.putOnDisk(Dictionary{{"key", 3}});
    EXPECT_TRUE(world.set("other", Value(1)));
    EXPECT_EQ(world.stateOnDisk(), Value(Dictionary{{"key", 3}, {"other", 1}}));
  });
}

TEST(ClientState, IsThereAfterARestart) {
  inEverySchedule(kSchedules, [] {
    sim::InMemoryDisk::Contents kept;
    {
      StateWorld world;
      world.start();
      EXPECT_TRUE(world.set("key", Value("kept")));
      kept = world.world.disk().read(kSuite);
    }
    StateWorld world;
    world.world.disk().write(kSuite, kept);
    world.start();
    EXPECT_EQ(world.get("key"), Value("kept"));
  });
}

}  // namespace
}  // namespace spacekeep::test
