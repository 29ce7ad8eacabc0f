// Thread safety: start() may be called from any thread, once; the rest happens on the event loop's
// thread, the handler on the global concurrent queue.
//
// A scheduled activity at work: it checks in, waits until decideDaily() lets it run, keeps the run
// on disk before it starts (a run that takes the daemon down is not tried again at every restart),
// and plans the next one when its handler has returned.
#pragma once

#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "support/events/daily_schedule.h"
#include "support/events/events.h"
#include "support/events/linux/event_loop.h"
#include "support/queues/concurrent_queue.h"

namespace spacekeep {

class DailyActivity : public std::enable_shared_from_this<DailyActivity> {
 public:
  struct Options {
    std::string name;
    DailySchedule schedule;
    std::string record_path;  ///< where the last run is remembered
    std::function<bool()> onMainsPower;
    std::function<Clocks()> readClocks;
  };

  /// The queue must outlive it.
  DailyActivity(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global,
                EventSources::ActivityHandler handler, Options options);

  void start();

 private:
  void call(ActivityState state);
  void plan();
  void decide();
  void run(const RunRecord& record);

  const std::shared_ptr<EventLoop> loop_;
  ConcurrentQueue& global_;
  const EventSources::ActivityHandler handler_;
  const Options options_;
  // Confined to the loop's thread.
  DailyPlan plan_;
  std::optional<BootTimer> timer_;
};

/// The clocks of this machine.
[[nodiscard]] Clocks readSystemClocks();

}  // namespace spacekeep
