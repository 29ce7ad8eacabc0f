// The order of the steps of start-up, as the world around the daemon sees them.
#include <gtest/gtest.h>

#include <string>
#include <utility>
#include <vector>

#include "daemon/start_up.h"
#include "tests/both/daemon/daemon_world.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::test {
namespace {

/// Says in the trace what is asked of it.
class TracedListener final : public ipc::Listener {
 public:
  explicit TracedListener(sim::Trace& trace) : trace_(trace) {}

  void setRequiredEntitlement(std::string entitlement) override {
    trace_.add(sim::WorldChanged{"the listener requires " + entitlement});
  }
  void resume() override { trace_.add(sim::WorldChanged{"the listener is resumed"}); }

 private:
  sim::Trace& trace_;
};

/// The same. Nothing ever happens, and parking is over at once.
class TracedEventSources final : public EventSources {
 public:
  TracedEventSources(sim::Trace& trace, const ConcurrentQueue& global)
      : trace_(trace), global_(global) {}

  void registerActivity(const std::string& name, ActivityHandler) override {
    trace_.add(sim::WorldChanged{"activity " + name});
  }
  void setStreamHandler(const std::string& stream, ConcurrentQueue& queue, StreamHandler) override {
    const std::string where = &queue == &global_ ? " on the global queue" : " elsewhere";
    trace_.add(sim::WorldChanged{"stream " + stream + where});
  }
  void installTerminationHandler(void (*handler)(int)) override {
    trace_.add(sim::WorldChanged{handler == &sigterm_handler ? "termination" : "something else"});
  }
  [[nodiscard]] int postNotification(const std::string& name) override {
    trace_.add(sim::WorldChanged{"notification " + name});
    return 0;
  }
  void park() override { trace_.add(sim::WorldChanged{"parked"}); }

 private:
  sim::Trace& trace_;
  const ConcurrentQueue& global_;
};

struct TracedWorld : DaemonWorld {
  TracedWorld() {
    platform.makeListener = [this](const ipc::ServedInterface&) {
      return std::make_unique<TracedListener>(world.trace());
    };
  }
  ~TracedWorld() {
    world.shutDown();
    Spacekeep::resetSharedSpacekeep();
  }

  /// Log lines, transactions and what was asked of the world, from `event` on.
  [[nodiscard]] std::vector<std::string> stepsFrom(std::size_t event) const {
    const auto events = world.trace().events();
    std::vector<std::string> steps;
    for (std::size_t at = event; at < events.size(); ++at) {
      const sim::EventBody& body = events[at].body;
      if (const auto* line = std::get_if<sim::LogLine>(&body)) {
        steps.push_back(textOfLine(*line));
      } else if (const auto* keep_alive = std::get_if<sim::KeepAliveIs>(&body)) {
        steps.push_back("keep-alive " + std::to_string(keep_alive->open));
      } else if (const auto* changed = std::get_if<sim::WorldChanged>(&body)) {
        steps.push_back(changed->what);
      }
    }
    return steps;
  }
};

TEST(StartUpOrder, EachStepComesInItsTurnAndTheTransactionCoversAllButTheParking) {
  inEverySchedule(kSchedules, [] {
    TracedWorld world;
    TracedEventSources events(world.world.trace(), world.platform.global);
    const std::size_t before = world.world.trace().events().size();
    startUp(world.platform, events, world.world.keepAlive());
    EXPECT_EQ(world.stepsFrom(before), (std::vector<std::string>{
                                           "keep-alive 1",
                                           "main timebaseInfo:  1 / 1, gTimebaseConversion: "
                                           "1.000000",
                                           "init plistDir: //System/Library/Spacekeep/",
                                           "init scanning //System/Library/Spacekeep/",
                                           "init scanning /QuorvelInternal/Library/Spacekeep/",
                                           "the listener requires CLIENT_ENTITLEMENT",
                                           "init resuming listener",
                                           "the listener is resumed",
                                           "activity com.quorvel.Spacekeep.daily",
                                           "stream com.quorvel.dispatch.vfs on the global queue",
                                           "termination",
                                           "notification com.quorvel.spacekeep.launched",
                                           "main Spacekeep, open for business!",
                                           "keep-alive 0",
                                           "parked",
                                       }));
  });
}

// In between, anybody would be let in.
TEST(StartUpOrder, TheListenerKnowsWhatToRequireBeforeItIsResumed) {
  inEverySchedule(kSchedules, [] {
    TracedWorld world;
    const std::size_t before = world.world.trace().events().size();
    world.start();
    const auto steps = world.stepsFrom(before);
    ASSERT_GE(steps.size(), 3U);
    EXPECT_EQ((std::vector<std::string>(steps.end() - 3, steps.end())),
              (std::vector<std::string>{"the listener requires CLIENT_ENTITLEMENT",
                                        "init resuming listener", "the listener is resumed"}));
  });
}

}  // namespace
}  // namespace spacekeep::test
