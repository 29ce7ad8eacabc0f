#include "support/events/daily_activity.h"

#include <algorithm>
#include <utility>

#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep {
namespace {

/// The end of a suspend may look like a small one; a write each time would wear the disk.
constexpr std::int64_t kSmallestClockJumpNs = 60'000'000'000;

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

DailyActivity::DailyActivity(std::shared_ptr<ActivityHost> host, ConcurrentQueue& global,
                             EventSources::ActivityHandler handler, Options options)
    : host_(std::move(host)),
      global_(global),
      handler_(std::move(handler)),
      options_(std::move(options)) {}

void DailyActivity::start() {
  host_->post([self = shared_from_this()] { self->begin(); });
}

void DailyActivity::begin() {
  const Clocks now = host_->readClocks();
  const auto last = host_->loadRecord();
  plan_.record = last ? recordAsOf(*last, now) : recordOfNoRun(options_.schedule, now);
  keepRecord();
  host_->whenWallClockIsSet([weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->wallClockWasSet();
  });
  call(ActivityState::kCheckIn);
}

/// Planning goes on when the handler has returned, so it is never called twice at a time.
void DailyActivity::call(ActivityState state) {
  is_planned_ = false;
  global_.async([self = shared_from_this(), state] {
    ActivityInState activity(state);
    self->handler_(activity);
    self->host_->post([self] { self->plan(); });
  });
}

void DailyActivity::plan() {
  plan_.since_boot_ns = host_->readClocks().boot_ns;
  plan_.delay_ns = randomDelayNs(options_.schedule);
  is_planned_ = true;
  decide();
}

void DailyActivity::decide() {
  if (!is_planned_) return;  // the handler is at work
  const Clocks now = host_->readClocks();
  if (now.boot_ns >= nextKeepingBootNs(kept_boot_ns_)) keepRecord();
  const DailyDecision decision = decideDaily(options_.schedule, plan_, now, host_->onMainsPower());
  switch (decision.step) {
    case DailyStep::kWait:
    case DailyStep::kWaitForPower:
      wakeNext(decision.wake_boot_ns);
      return;
    case DailyStep::kRun:
      run(decision.record);
      return;
  }
}

void DailyActivity::wakeNext(std::uint64_t boot_ns) {
  host_->wakeAt(std::min(boot_ns, nextKeepingBootNs(kept_boot_ns_)), [weak = weak_from_this()] {
    if (const auto self = weak.lock()) self->decide();
  });
}

void DailyActivity::run(const RunRecord& record) {
  plan_.record = record;
  keepRecord();
  logTrace("%s runs %s", "run", options_.name);
  call(ActivityState::kRun);
}

/// After the next restart of the machine the record is read by the clock as it stands now.
void DailyActivity::wallClockWasSet() {
  const Clocks now = host_->readClocks();
  const std::int64_t then_ns =
      plan_.record.wall_ns - static_cast<std::int64_t>(plan_.record.boot_ns);
  const std::int64_t now_ns = now.wall_ns - static_cast<std::int64_t>(now.boot_ns);
  if (std::max(then_ns, now_ns) - std::min(then_ns, now_ns) >= kSmallestClockJumpNs) keepRecord();
}

void DailyActivity::keepRecord() {
  const Clocks now = host_->readClocks();
  plan_.record = recordAsOf(plan_.record, now);
  kept_boot_ns_ = now.boot_ns;
  if (const auto reason = host_->saveRecord(plan_.record)) {
    logProblem("%s cannot keep the run times of %s: %s", "keepRecord", options_.name, *reason);
  }
}

}  // namespace spacekeep
