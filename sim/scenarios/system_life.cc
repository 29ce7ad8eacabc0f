#include "sim/scenarios/system_life.h"

#include <algorithm>
#include <memory>
#include <utility>

#include "daemon/spacekeep.h"
#include "sim/scenarios/system_stage.h"
#include "support/runtime/splitmix.h"

namespace spacekeep::sim {
namespace {

constexpr std::int64_t kFirstWallClockNs = 1'700'000'000'000'000'000;
// A run takes some thousands. What takes that many goes round in circles.
constexpr std::uint64_t kMaxSteps = 1'000'000;

std::uint64_t scheduleSeedOf(const SystemRun& run) {
  const std::uint64_t own = rt::SplitMix::mix(run.seed);
  return run.schedule == 0 ? own : rt::SplitMix::mix(own ^ run.schedule);
}

rt::ScheduleOptions optionsFor(const SystemRun& run, unsigned number, const Lasting& lasting) {
  rt::ScheduleOptions options;
  options.seed = scheduleSeedOf(run) + number;
  options.strategy = run.seed % 2 == 0 ? rt::Strategy::kRandom : rt::Strategy::kPct;
  options.pct_depth = 2 + static_cast<unsigned>(run.seed / 2 % 4);
  options.max_steps = kMaxSteps;
  options.wall_clock_start_ns = lasting.wall_clock_ns;
  if (number < run.plan.crashes.size()) {
    options.max_steps = std::clamp<std::uint64_t>(run.plan.crashes[number].at_step, 1, kMaxSteps);
  }
  return options;
}

/// Whether the daemon waits for a ping for which there is no answer.
bool waitsForSilentPing(const std::vector<Event>& events, std::size_t first) {
  std::set<std::uint64_t> unanswered;
  for (std::size_t i = first; i < events.size(); ++i) {
    const EventBody& body = events[i].body;
    if (const auto* asked = std::get_if<ServiceAsked>(&body)) {
      if (asked->member == "servicePing") unanswered.insert(asked->call);
    } else if (const auto* answered = std::get_if<ServiceAnswered>(&body)) {
      unanswered.erase(answered->call);
    } else if (const auto* changed = std::get_if<WorldChanged>(&body)) {
      if (changed->what.ends_with(kPingLost)) return true;
    }
  }
  return !unanswered.empty();
}

SystemEnd endOf(const SystemRun& run, const LifeOfDaemon& life, std::size_t first_event) {
  if (life.killed || life.report.end == rt::ScheduleEnd::kFinished) return SystemEnd::kFinished;
  if (life.report.end == rt::ScheduleEnd::kStuck) return SystemEnd::kStuck;
  const bool may_be_silent = run.plan.faults.contains(Fault::kSilentPing);
  return may_be_silent && waitsForSilentPing(run.events, first_event) ? SystemEnd::kSilentPing
                                                                      : SystemEnd::kDeadlock;
}

std::int64_t jumpsSince(const std::vector<Event>& events, std::size_t first) {
  std::int64_t sum = 0;
  for (std::size_t i = first; i < events.size(); ++i) {
    if (const auto* jump = std::get_if<ClockJumped>(&events[i].body)) sum += jump->by_ns;
  }
  return sum;
}

void goOn(const SystemRun& run, unsigned number, std::size_t first_event, Lasting& lasting) {
  const LifeOfDaemon& life = run.lives.back();
  std::uint64_t down_ns = 0;
  if (number < run.plan.crashes.size()) down_ns = run.plan.crashes[number].down_for_ns;
  const std::uint64_t passed_ns = life.report.virtual_ns + down_ns;
  lasting.now_ns += passed_ns;
  lasting.wall_clock_ns +=
      static_cast<std::int64_t>(passed_ns) + jumpsSince(run.events, first_event);
  lasting.disk = life.disk_at_end;
  for (const auto& [id, service] : life.services) lasting.owns[id] = service.owns_at_end;
}

}  // namespace

Lasting lastingAtFirst(const SystemPlan& plan) {
  Lasting lasting;
  lasting.wall_clock_ns = kFirstWallClockNs;
  for (const PlannedVolume& volume : plan.volumes) {
    lasting.free_bytes[volume.path] = volume.free_bytes;
  }
  for (const SystemService& service : plan.services) {
    lasting.owns[service.id] = service.behaviour.owns;
  }
  return lasting;
}

void playLife(SystemRun& run, unsigned number, Lasting& lasting) {
  const rt::ScheduleOptions options = optionsFor(run, number, lasting);
  const std::size_t first_event = run.events.size();
  LifeOfDaemon life;
  life.began_ns = lasting.now_ns;
  life.wall_clock_began_ns = lasting.wall_clock_ns;
  life.disk_at_start = lasting.disk;
  life.report = rt::runSchedule(options, [&] {
    SystemStage stage(run, number, life, lasting);
    stage.play();
  });
  life.killed = number < run.plan.crashes.size() && life.report.end == rt::ScheduleEnd::kStuck;
  life.end = endOf(run, life, first_event);
  run.events.push_back({life.began_ns + life.report.virtual_ns, 0, LifeEnded{number, life.killed}});
  run.steps += life.report.steps;
  run.trace_hash = rt::SplitMix::mix(run.trace_hash ^ life.report.trace_hash);
  run.lives.push_back(std::move(life));
  goOn(run, number, first_event, lasting);
}

}  // namespace spacekeep::sim
