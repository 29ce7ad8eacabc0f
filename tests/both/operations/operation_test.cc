#include "operations/operation.h"

#include <gtest/gtest.h>

#include <algorithm>

#include "operations/info_keys.h"
#include "sim/world/world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Schedules per test; on real threads it is far fewer.
constexpr unsigned kSchedules = 50;
/// On real threads this is a few seconds, which a busy machine may need.
constexpr std::uint64_t kPatienceNs = 3'600'000'000'000;

class IdleOperation : public SpacekeepOperation {
 public:
  using SpacekeepOperation::SpacekeepOperation;
  void startOperation(OperationCompletion completion) override { completion(result()); }
};

/// Lets a test set what only operations themselves may set.
class OpenOperation : public IdleOperation {
 public:
  using IdleOperation::IdleOperation;
  using SpacekeepOperation::setCollection_queue;
  using SpacekeepOperation::setInFlight;
  using SpacekeepOperation::setInfo;
  using SpacekeepOperation::setMessage_queue;
  using SpacekeepOperation::setResult;
  using SpacekeepOperation::setServices;
  using SpacekeepOperation::setUrgencyLimit;
  using SpacekeepOperation::setVolume;
};

struct OperationWorld {
  OperationWorld() { world.volumes().add("/", 1000, 100); }
  ~OperationWorld() { world.shutDown(); }
  OperationWorld(const OperationWorld&) = delete;
  OperationWorld& operator=(const OperationWorld&) = delete;

  std::shared_ptr<sim::SimulatedService> add(const std::string& service_id,
                                             sim::ServiceBehaviour behaviour = {}) {
    auto service = world.addService(service_id, std::move(behaviour));
    world.connector().declare(service);
    services[service_id] = std::make_shared<SKService>(service_id);
    return service;
  }
  std::shared_ptr<IdleOperation> make(const Value& info) {
    return makeOperation<IdleOperation>(platform, info, services);
  }
  /// The result of an operation that must have been refused.
  Dictionary refusalOf(const Value& info) {
    const auto operation = std::make_shared<IdleOperation>(platform);
    EXPECT_FALSE(operation->initWithInfo(info, services));
    return operation->result();
  }
  std::vector<std::string> problems() { return world.trace().linesOfLevel(kLogProblem); }

  /// How often this line was written for tracing.
  [[nodiscard]] std::ptrdiff_t traces(std::string_view text) const {
    return std::ranges::count(world.trace().linesOfLevel(kLogTrace), text);
  }

  [[nodiscard]] bool eventually(const std::function<bool()>& condition) {
    return world.eventually(condition, kPatienceNs);
  }

  mutable sim::World world;
  Platform& platform = world.platform();
  ServiceMap services;
};

TEST(OperationConstruction, InfoThatIsAnArrayIsRefusedBeforeTheVolumeIsLookedAt) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    EXPECT_EQ(world.refusalOf(Array{1, 2}),
              (Dictionary{{keys::kError, "Parameter error, info is not a dict"}}));
    EXPECT_EQ(world.problems(), std::vector<std::string>{"initWithInfo info is not a dictionary!"});
  });
}

TEST(OperationConstruction, InfoWithoutAVolumeIsRefused) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    EXPECT_EQ(world.refusalOf(Dictionary{{"A", 1}}),
              (Dictionary{{keys::kError, "Parameter error, no Volume key in info dict"}}));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{"initWithInfo No Volume key in info: {\"A\": 1}"});
  });
}

TEST(OperationConstruction, AVolumeThatIsANumberIsRefused) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    EXPECT_EQ(world.refusalOf(Dictionary{{keys::kVolume, 7}}),
              (Dictionary{{keys::kError, "Parameter error, no Volume key in info dict"}}));
    EXPECT_EQ(
        world.problems(),
        std::vector<std::string>{"initWithInfo No Volume key in info: {\"SPACEKEEP_VOLUME\": 7}"});
  });
}

TEST(OperationConstruction, TheVolumeOfARefusedRequestIsKeptAsItCame) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    for (const Value& volume : {Value(7), Value("/gone")}) {
      const auto operation = std::make_shared<IdleOperation>(world.platform);
      EXPECT_FALSE(operation->initWithInfo(Dictionary{{keys::kVolume, volume}}, world.services));
      EXPECT_EQ(operation->volume(), volume);
    }
  });
}

TEST(OperationConstruction, AVolumeThatIsNotMountedIsRefused) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    EXPECT_EQ(
        world.refusalOf(Dictionary{{keys::kVolume, "/gone"}}),
        (Dictionary{{keys::kError, "Parameter error, Unable to validate volume in info dict"}}));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{"initWithInfo Unable to validate volume: /gone"});
    EXPECT_EQ(world.make(Dictionary{{keys::kVolume, "/gone"}}), nullptr);
  });
}

TEST(OperationConstruction, TheResultStartsAsTheRequestKeyForKey) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    world.add("cache");
    const Dictionary info{{keys::kVolume, "/"}, {keys::kAmount, 5}, {"MINE", Array{1, "x"}}};
    const auto operation = world.make(info);
    ASSERT_NE(operation, nullptr);
    EXPECT_EQ(operation->result(), info);
    EXPECT_EQ(operation->info(), info);
    EXPECT_EQ(operation->volume(), Value("/"));
    EXPECT_EQ(operation->services().size(), 1U);
    EXPECT_EQ(operation->inFlightCount(), 0U);
    EXPECT_EQ(operation->collection_queue()->label(), "com.quorvel.spacekeep_operation_collection");
    EXPECT_EQ(operation->message_queue()->label(), "com.quorvel.spacekeep_operation_message");
  });
}

TEST(OperationProperties, EachIsWhatItWasSetTo) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto operation = makeOperation<OpenOperation>(
        world.platform, Dictionary{{keys::kVolume, "/"}}, world.services);
    const auto collection = SerialQueue::create("collection", world.world.global());
    const auto message = SerialQueue::create("message", world.world.global());
    operation->setInfo({{"INFO", 1}});
    operation->setServices(ServiceMap{{"cache", std::make_shared<SKService>("cache")}});
    operation->setResult({{"RESULT", 2}});
    operation->setInFlight({"a", "b"});
    operation->setVolume(Value("/data"));
    operation->setUrgencyLimit(4);
    operation->setCollection_queue(collection);
    operation->setMessage_queue(message);
    EXPECT_EQ(operation->info(), (Dictionary{{"INFO", 1}}));
    EXPECT_TRUE(operation->services().contains("cache"));
    EXPECT_EQ(operation->result(), (Dictionary{{"RESULT", 2}}));
    EXPECT_EQ(operation->copyInFlight(), (std::set<std::string>{"a", "b"}));
    EXPECT_EQ(operation->volume(), Value("/data"));
    EXPECT_EQ(operation->urgencyLimit(), 4);
    EXPECT_EQ(operation->collection_queue(), collection);
    EXPECT_EQ(operation->message_queue(), message);
  });
}

TEST(OperationConstruction, EachOperationHasItsOwnQueues) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto one = world.make(Dictionary{{keys::kVolume, "/"}});
    const auto other = world.make(Dictionary{{keys::kVolume, "/"}});
    EXPECT_NE(one->collection_queue(), other->collection_queue());
    EXPECT_NE(one->message_queue(), other->message_queue());
  });
}

TEST(UrgencyLimit, OutOfRangeBecomesThreeAndIsNotClamped) {
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 0}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 1}}), 1);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 4}}), 4);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 5}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 9}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, -1}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, UINT64_MAX}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 2.9}}), 2);
}

TEST(UrgencyLimit, TheSecondKeyIsReadOnlyWhenTheFirstIsAbsent) {
  EXPECT_EQ(urgencyLimitOf({}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgencyLimit, 2}}), 2);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 1}, {keys::kUrgencyLimit, 4}}), 1);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, 9}, {keys::kUrgencyLimit, 1}}), 3);
}

TEST(UrgencyLimit, ATextIsNoNumberAndStillHidesTheSecondKey) {
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, "2"}, {keys::kUrgencyLimit, 1}}), 3);
  EXPECT_EQ(urgencyLimitOf({{keys::kUrgency, true}, {keys::kUrgencyLimit, 1}}), 3);
}

TEST(UrgencyLimit, AnOperationTakesItFromItsRequest) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto limitOf = [&](Dictionary info) {
      info.set(keys::kVolume, "/");
      return world.make(info)->urgencyLimit();
    };
    EXPECT_EQ(limitOf({}), 3);
    EXPECT_EQ(limitOf({{keys::kUrgency, 4}}), 4);
    EXPECT_EQ(limitOf({{keys::kUrgencyLimit, 2}}), 2);
    EXPECT_EQ(limitOf({{keys::kUrgency, "2"}, {keys::kUrgencyLimit, 1}}), 3);
  });
}

TEST(InFlight, AddingTwiceAnswersTrueThenFalseAndComplains) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    EXPECT_TRUE(operation->updateInFlight("cache", true));
    EXPECT_FALSE(operation->updateInFlight("cache", true));
    EXPECT_EQ(operation->inFlightCount(), 1U);
    EXPECT_EQ(
        world.world.trace().linesWithFormat("%s %s %@"),
        (std::vector<std::string>{"updateInFlight adding cache", "updateInFlight adding cache"}));
    EXPECT_EQ(world.problems(),
              std::vector<std::string>{
                  "updateInFlight trying to add \"cache\", which is already inFlight"});
  });
}

TEST(InFlight, RemovingWhatIsNotThereAnswersFalseAndIsRoutine) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    operation->updateInFlight("other", true);
    EXPECT_FALSE(operation->updateInFlight("cache", false));
    EXPECT_EQ(operation->copyInFlight(), std::set<std::string>{"other"});
    EXPECT_TRUE(world.problems().empty());
    EXPECT_TRUE(world.world.trace().hasLine("updateInFlight removing cache"));
    EXPECT_TRUE(world.world.trace().hasLine(
        "updateInFlight trying to remove \"cache\", which is not inFlight"));
  });
}

TEST(InFlight, RemovingWhatIsThereAnswersTrue) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    operation->updateInFlight("cache", true);
    EXPECT_TRUE(operation->updateInFlight("cache", false));
    EXPECT_EQ(operation->inFlightCount(), 0U);
  });
}

TEST(OperationCancel, WithNothingInFlightSendsNothing) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto cache = world.add("cache");
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    EXPECT_TRUE(operation->implementsCancelOperation());
    operation->cancelOperation();
    world.world.shutDown();
    EXPECT_TRUE(cache->calls().empty());
  });
}

TEST(OperationCancel, AsksEachServiceInFlightAndLeavesItThere) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto a = world.add("a");
    const auto b = world.add("b");
    const auto idle = world.add("idle");
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    operation->updateInFlight("a", true);
    operation->updateInFlight("b", true);
    operation->cancelOperation();
    EXPECT_TRUE(world.eventually([&] {
      return a->callCount("serviceCancelPurge") == 1 && b->callCount("serviceCancelPurge") == 1;
    }));
    EXPECT_EQ(operation->inFlightCount(), 2U);
    EXPECT_TRUE(idle->calls().empty());
  });
}

TEST(OperationCancel, AServiceWhoseConnectionFailsLeavesTheSet) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    sim::ServiceBehaviour failing;
    failing.cancel.answer = sim::Answer::kFailsBeforeCall;
    world.add("broken", failing);
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    operation->updateInFlight("broken", true);
    operation->cancelOperation();
    EXPECT_TRUE(world.eventually([&] { return operation->inFlightCount() == 0; }));
    EXPECT_EQ(world.traces("cancelOperation connection invalidated: broken"), 1);
  });
}

TEST(OperationCancel, AServiceWithoutARecordLeavesTheSetAsIfItsConnectionHadFailed) {
  inEverySchedule(kSchedules, [] {
    OperationWorld world;
    const auto operation = world.make(Dictionary{{keys::kVolume, "/"}});
    operation->updateInFlight("nobody", true);
    operation->cancelOperation();
    EXPECT_TRUE(world.eventually([&] { return operation->inFlightCount() == 0; }));
    EXPECT_EQ(world.traces("cancelOperation connection invalidated: nobody"), 1);
  });
}

}  // namespace
}  // namespace spacekeep::test
