// Thread safety: start() may be called from any thread, once; the rest happens on the host's
// thread, the handler on the global concurrent queue.
//
// A scheduled activity at work: it checks in, waits until decideDaily() lets it run, keeps the run
// on disk before it starts (a run that takes the daemon down is not tried again at every restart),
// and plans the next one when its handler has returned.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "support/events/daily_schedule.h"
#include "support/events/events.h"
#include "support/queues/concurrent_queue.h"

namespace spacekeep {

/// What an activity stands on: one thread with a timer, the clocks, the power and the disk. Only
/// post() is called from other threads.
class ActivityHost {
 public:
  using Callback = std::function<void()>;

  virtual ~ActivityHost() = default;
  /// Runs `callback` on the host's thread.
  virtual void post(Callback callback) = 0;
  /// Calls `fired` once at that boot time, at once when it has passed (after a suspend as soon as
  /// the machine is up again). Replaces an earlier time.
  virtual void wakeAt(std::uint64_t boot_ns, Callback fired) = 0;
  /// Calls `set` each time that somebody has set the wall clock.
  virtual void whenWallClockIsSet(Callback set) = 0;
  [[nodiscard]] virtual Clocks readClocks() = 0;
  [[nodiscard]] virtual bool onMainsPower() = 0;
  /// None when there is none.
  [[nodiscard]] virtual std::optional<RunRecord> loadRecord() = 0;
  /// None on success, else what went wrong in words.
  [[nodiscard]] virtual std::optional<std::string> saveRecord(const RunRecord& record) = 0;
};

class DailyActivity : public std::enable_shared_from_this<DailyActivity> {
 public:
  struct Options {
    std::string name;
    DailySchedule schedule;
  };

  /// The queue must outlive it.
  DailyActivity(std::shared_ptr<ActivityHost> host, ConcurrentQueue& global,
                EventSources::ActivityHandler handler, Options options);

  void start();

 private:
  void begin();
  void call(ActivityState state);
  void plan();
  void decide();
  void wakeNext(std::uint64_t boot_ns);
  void run(const RunRecord& record);
  void wallClockWasSet();
  /// Keeps the time passed so far, so that a restart with a wrong wall clock costs little of it.
  void keepRecord();

  const std::shared_ptr<ActivityHost> host_;
  ConcurrentQueue& global_;
  const EventSources::ActivityHandler handler_;
  const Options options_;
  // Confined to the host's thread.
  DailyPlan plan_;
  std::uint64_t kept_boot_ns_ = 0;
  bool is_planned_ = false;
};

}  // namespace spacekeep
