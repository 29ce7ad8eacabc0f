#include "sim/scenarios/system_run.h"

#include <utility>

#include "sim/scenarios/system_life.h"

namespace spacekeep::sim {
namespace {

/// Follows the calls of clients through the trace.
class CallsOfClients {
 public:
  explicit CallsOfClients(SystemRun& run) : calls_(run.calls) {}

  void operator()(const LifeBegan& life) { life_ = life.life; }
  void operator()(const ClientAsked& asked) {
    CallOfClient& call = calls_[asked.call];
    call.life = life_;
    call.client = asked.client;
    call.member = asked.member;
  }
  void operator()(const ClientAnswered& answered) {
    CallOfClient& call = calls_[answered.call];
    if (++call.answers > 1) return;
    call.state = ClientCall::State::kAnswered;
    call.answer = answered.answer;
    call.value = answered.value;
  }
  void operator()(const ClientRefused& refused) {
    CallOfClient& call = calls_[refused.call];
    call.state = ClientCall::State::kFailed;
    call.error = refused.error;
  }
  void operator()(const ClientDropped& dropped) {
    calls_[dropped.call].state = ClientCall::State::kDropped;
  }
  template <class Other>
  void operator()(const Other&) {}

 private:
  std::map<std::uint64_t, CallOfClient>& calls_;
  unsigned life_ = 0;
};

}  // namespace

SystemRun playSystem(const SystemPlan& plan, std::uint64_t seed, std::uint64_t schedule) {
  SystemRun run;
  run.plan = plan;
  run.seed = seed;
  run.schedule = schedule;
  Lasting lasting = lastingAtFirst(plan);
  for (unsigned number = 0; number <= plan.crashes.size(); ++number) {
    playLife(run, number, lasting);
    const LifeOfDaemon& life = run.lives.back();
    if (run.end == SystemEnd::kFinished && life.end != SystemEnd::kFinished) {
      run.end = life.end;
      run.blocked = life.report.blocked;
    }
    if (life.end == SystemEnd::kDeadlock || life.end == SystemEnd::kStuck) break;
  }
  CallsOfClients follow(run);
  for (const Event& event : run.events) std::visit(follow, event.body);
  return run;
}

}  // namespace spacekeep::sim
