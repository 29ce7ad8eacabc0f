#include "sim/scenarios/purge_run.h"

#include <memory>
#include <utility>

#include "daemon/spacekeep.h"
#include "sim/world/world.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
// Longer than any delay that a scenario draws: afterwards only what never comes is outstanding.
constexpr std::uint64_t kAftermathNs = 300 * kSecond;
// A run takes about 3000. What takes that many goes round in circles.
constexpr std::uint64_t kMaxSteps = 500'000;

/// Joined also when the schedule is broken off.
struct Clients {
  Clients() = default;
  ~Clients() {
    for (rt::Thread& client : threads) {
      if (client.joinable()) client.join();
    }
  }
  Clients(const Clients&) = delete;
  Clients& operator=(const Clients&) = delete;

  std::vector<rt::Thread> threads;
};

/// The cast of one run. Lives inside the schedule.
class Stage {
 public:
  explicit Stage(PurgeRun& run)
      : run_(run),
        world_({.parallelism = run.scenario.parallelism}),
        calls_(run.scenario.purges.size()) {
    for (const PlannedVolume& volume : run.scenario.volumes) {
      world_.volumes().add(volume.path, volume.size_bytes, volume.free_bytes);
    }
    for (const PlannedService& plan : run.scenario.services) addService(plan);
    daemon_ = Spacekeep::create(world_.platform());
  }

  // What happened is told also when the schedule could not be played to its end.
  ~Stage() {
    if (run_.events.empty()) run_.events = world_.trace().take();
  }
  Stage(const Stage&) = delete;
  Stage& operator=(const Stage&) = delete;

  void play() {
    for (std::size_t i = 0; i < services_.size(); ++i) startService(i);
    for (const PlannedWrite& write : run_.scenario.writes) startWrite(write);
    Clients clients;
    for (std::size_t i = 0; i < run_.scenario.purges.size(); ++i) {
      clients.threads.emplace_back("client", [this, i] { playClient(i); });
    }
    for (rt::Thread& client : clients.threads) client.join();
    rt::sleepNs(kAftermathNs);
    lookAtTheEnd();
  }

  void takeDown() {
    world_.shutDown();
    daemon_.reset();
  }

 private:
  void addService(const PlannedService& plan) {
    if (plan.declared) {
      Dictionary keys;
      if (!plan.purges) keys.set("SPACEKEEP_SERVICES", Array{Value("PERIODIC")});
      services_.push_back(world_.declareService(plan.id, plan.behaviour, std::move(keys)));
    } else {
      services_.push_back(world_.addService(plan.id, plan.behaviour));
    }
  }

  void startService(std::size_t index) {
    const PlannedService& plan = run_.scenario.services[index];
    if (plan.declared) {
      if (plan.end) world_.after(plan.end->after_ns, [this, index] { endService(index); });
      return;
    }
    world_.after(plan.check_in_after_ns, [this, index] { checkIn(index); });
  }

  // A death before the check-in is answered would be unfair, see the scenario.
  void checkIn(std::size_t index) {
    const PlannedService& plan = run_.scenario.services[index];
    (void)world_.checkIn(services_[index], {{"PURGE", plan.purges}})->wait();
    if (plan.purges_after_second_check_in) {
      (void)world_.checkIn(services_[index], {{"PURGE", *plan.purges_after_second_check_in}})
          ->wait();
    }
    if (plan.end) world_.after(plan.end->after_ns, [this, index] { endService(index); });
  }

  void endService(std::size_t index) {
    const PlannedService& plan = run_.scenario.services[index];
    if (plan.end->dies) {
      services_[index]->die();
    } else {
      services_[index]->closeConnections();
    }
    if (!plan.end->returns_after_ns) return;
    world_.after(*plan.end->returns_after_ns, [this, index] { bringBack(index); });
  }

  void bringBack(std::size_t index) {
    const PlannedService& plan = run_.scenario.services[index];
    services_[index]->start();
    if (!plan.declared) (void)world_.checkIn(services_[index], {{"PURGE", plan.purges}})->wait();
  }

  void startWrite(const PlannedWrite& write) {
    world_.after(write.after_ns, [this, write] {
      if (write.frees) {
        world_.volumes().giveBack(write.volume, write.bytes);
      } else {
        world_.volumes().write(write.volume, write.bytes);
      }
    });
  }

  void playClient(std::size_t index) {
    const PlannedPurge& plan = run_.scenario.purges[index];
    const std::string name = "client-" + std::to_string(index);
    std::set<std::string, std::less<>> rights;
    if (plan.entitled) rights.insert("PURGE_ENTITLEMENT");
    const auto peer = world_.client(name, std::move(rights));
    rt::sleepNs(plan.after_ns);
    const auto call = world_.call(peer, "clientPurge", {plan.info});
    calls_[index] = call;
    if (plan.cancelled_after_ns) {
      rt::sleepNs(*plan.cancelled_after_ns);
      Dictionary which;
      if (const Value* token = plan.info.find("SPACEKEEP_TOKEN")) {
        which.set("SPACEKEEP_TOKEN", *token);
      }
      (void)world_.call(peer, "clientCancelPurge", {which})->wait();
    }
    (void)call->wait();
  }

  void lookAtTheEnd() {
    for (const auto& call : calls_) run_.answers[call->number()] = call->answers();
    for (const auto& service : services_) {
      run_.asked_twice[service->id()] = service->askedTwiceAtOnce();
    }
    run_.events = world_.trace().take();
  }

  PurgeRun& run_;
  World world_;
  std::vector<std::shared_ptr<SimulatedService>> services_;
  std::shared_ptr<Spacekeep> daemon_;
  std::vector<std::shared_ptr<ClientCall>> calls_;  // of purges, each written by its client
};

}  // namespace

rt::ScheduleOptions scheduleFor(std::uint64_t seed) {
  rt::ScheduleOptions options;
  options.seed = seed;
  options.strategy = seed % 2 == 0 ? rt::Strategy::kRandom : rt::Strategy::kPct;
  options.max_steps = kMaxSteps;
  options.pct_depth = 2 + static_cast<unsigned>(seed / 2 % 4);
  return options;
}

PurgeRun playPurgeScenario(PurgeScenario scenario, const rt::ScheduleOptions& options) {
  PurgeRun run;
  run.scenario = std::move(scenario);
  run.report = rt::runSchedule(options, [&run] {
    Stage stage(run);
    stage.play();
    stage.takeDown();
  });
  return run;
}

PurgeRun runPurgeScenario(std::uint64_t seed) {
  return playPurgeScenario(derivePurgeScenario(seed), scheduleFor(seed));
}

}  // namespace spacekeep::sim
