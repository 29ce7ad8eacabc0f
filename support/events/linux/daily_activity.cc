#include "support/events/linux/daily_activity.h"

#include <fstream>
#include <utility>

#include "support/events/linux/event_files.h"
#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep {
namespace {

class ActivityInState final : public Activity {
 public:
  explicit ActivityInState(ActivityState state) : state_(state) {}
  [[nodiscard]] ActivityState state() const override { return state_; }

 private:
  const ActivityState state_;
};

std::uint64_t randomDelayNs(const DailySchedule& schedule) {
  constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
  const std::uint64_t bound_ns = schedule.random_delay_seconds * kNsPerSecond;
  return bound_ns == 0 ? 0 : rt::randomNumber() % bound_ns;
}

}  // namespace

DailyActivity::DailyActivity(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global,
                             EventSources::ActivityHandler handler, Options options)
    : loop_(std::move(loop)),
      global_(global),
      handler_(std::move(handler)),
      options_(std::move(options)) {}

void DailyActivity::start() {
  loop_->post([self = shared_from_this()] {
    self->timer_.emplace(*self->loop_, [raw = self.get()] { raw->decide(); });
    self->plan_.last = loadRunRecord(self->options_.record_path);
    self->call(ActivityState::kCheckIn);
  });
}

/// Planning goes on when the handler has returned, so it is never called twice at a time.
void DailyActivity::call(ActivityState state) {
  global_.async([self = shared_from_this(), state] {
    ActivityInState activity(state);
    self->handler_(activity);
    self->loop_->post([self] { self->plan(); });
  });
}

void DailyActivity::plan() {
  plan_.since_boot_ns = options_.readClocks().boot_ns;
  plan_.delay_ns = randomDelayNs(options_.schedule);
  decide();
}

void DailyActivity::decide() {
  const DailyDecision decision =
      decideDaily(options_.schedule, plan_, options_.readClocks(), options_.onMainsPower());
  switch (decision.step) {
    case DailyStep::kWait:
    case DailyStep::kWaitForPower:
      timer_->setFor(decision.wake_boot_ns);
      return;
    case DailyStep::kRun:
      run(decision.record);
      return;
  }
}

void DailyActivity::run(const RunRecord& record) {
  plan_.last = record;
  if (const auto reason = saveRunRecord(options_.record_path, record)) {
    logProblem("%s cannot keep the run of %s in %s: %s", "DailyActivity", options_.name,
               options_.record_path, *reason);
  }
  logTrace("%s runs %s", "DailyActivity", options_.name);
  call(ActivityState::kRun);
}

Clocks readSystemClocks() {
  Clocks clocks{.wall_ns = rt::wallClockNs(), .boot_ns = bootClockNs(), .boot_id = {}};
  std::ifstream("/proc/sys/kernel/random/boot_id") >> clocks.boot_id;
  return clocks;
}

}  // namespace spacekeep
