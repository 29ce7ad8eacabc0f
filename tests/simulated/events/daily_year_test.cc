// A year in the life of a machine, many times over: when the daily activity really runs.
// SPACEKEEP_YEARS sets how many years of each kind are tried.
#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>

#include "support/runtime/simulation.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/schedules.h"
#include "tests/simulated/events/virtual_machine.h"

namespace spacekeep::test {
namespace {

constexpr std::uint64_t kSecond = 1'000'000'000;
constexpr std::uint64_t kMinute = 60 * kSecond;
constexpr std::uint64_t kHour = 60 * kMinute;
constexpr std::uint64_t kDay = 24 * kHour;

/// The schedule as it is shipped.
constexpr DailySchedule kShipped{.interval_seconds = 86400,
                                 .random_delay_seconds = 3600,
                                 .wants_mains_power = true,
                                 .mains_power_wait_seconds = 86400};

unsigned yearsToTry() {
  const char* years = std::getenv("SPACEKEEP_YEARS");
  return years == nullptr ? 20 : static_cast<unsigned>(std::atoi(years));
}

/// From `least` to `most`, in steps of a thousandth.
std::uint64_t between(std::uint64_t least, std::uint64_t most) {
  return least + (most - least) / 1000 * rt::choose(1001);
}
bool oneIn(std::uint64_t chances) { return rt::choose(chances) == 0; }

/// Which of these happen in a year.
struct Life {
  bool suspends = false;
  bool battery = false;
  bool restarts = false;        ///< of the daemon and of the machine
  bool clock_is_set = false;    ///< either way, by anything from seconds to a month
  bool clock_is_lost = false;   ///< stands years earlier after some restarts of the machine
  bool clock_runs_off = false;  ///< stands up to a month later after some restarts
};

/// One daemon, from its start to its end.
class Daemon {
 public:
  explicit Daemon(VirtualMachine& machine)
      : machine_(machine),
        global_({}),
        host_(std::make_shared<VirtualHost>(machine)),
        activity_(std::make_shared<DailyActivity>(
            host_, global_,
            [&machine](Activity& activity) {
              if (activity.state() == ActivityState::kRun) machine.recordRun();
              rt::sleepNs(20 * kSecond);
            },
            DailyActivity::Options{.name = "daily", .schedule = kShipped})) {
    machine_.daemonUp();
    activity_->start();
  }
  ~Daemon() {
    host_->stop();
    machine_.daemonDown();
  }
  Daemon(const Daemon&) = delete;
  Daemon& operator=(const Daemon&) = delete;

 private:
  VirtualMachine& machine_;
  ConcurrentQueue global_;
  std::shared_ptr<VirtualHost> host_;
  std::shared_ptr<DailyActivity> activity_;
};

/// What happens in a year, drawn from the schedule's seed. After each thing there is a quarter of
/// an hour at least in which nothing happens.
class Year {
 public:
  explicit Year(Life life) : life_(life) { daemon_.emplace(machine); }

  void live() {
    const std::uint64_t began = rt::ticks();
    while (rt::ticks() - began < 365 * kDay) {
      rt::sleepNs(between(15 * kMinute, 12 * kHour));
      somethingHappens();
    }
    daemon_.reset();
  }

  VirtualMachine machine;
  std::uint64_t times_run_off = 0;

 private:
  void somethingHappens() {
    switch (rt::choose(5)) {
      case 0:
        if (life_.suspends) suspend();
        return;
      case 1:
        if (life_.battery) machine.plugIn(oneIn(3));
        return;
      case 2:
        if (life_.clock_is_set) setClock();
        return;
      case 3:
        if (life_.restarts) restartDaemon();
        return;
      case 4:
        if (life_.restarts) restartMachine();
        return;
      default:
        return;
    }
  }
  void suspend() {
    machine.suspend();
    rt::sleepNs(oneIn(5) ? between(kHour, 3 * kDay) : between(kSecond, 10 * kHour));
    machine.resume();
  }
  void setClock() {
    const std::uint64_t by = oneIn(2) ? between(kSecond, kHour) : between(kHour, 30 * kDay);
    const auto by_ns = static_cast<std::int64_t>(by);
    machine.jumpWallClockNs(oneIn(2) ? by_ns : -by_ns);
  }
  void restartDaemon() {
    daemon_.reset();
    rt::sleepNs(oneIn(10) ? between(kHour, 2 * kDay) : between(kSecond, kMinute));
    daemon_.emplace(machine);
  }
  void restartMachine() {
    daemon_.reset();
    rt::sleepNs(oneIn(4) ? between(kHour, 5 * kDay) : between(10 * kSecond, 10 * kMinute));
    if (life_.clock_is_lost && oneIn(2)) loseClock();
    if (life_.clock_runs_off && oneIn(4)) {
      machine.jumpWallClockNs(static_cast<std::int64_t>(between(kDay, 30 * kDay)));
      ++times_run_off;
    }
    machine.powerOn();
    daemon_.emplace(machine);
  }
  /// Back to the same moment each time, as without a battery for the clock.
  void loseClock() {
    const std::int64_t wall_ns = machine.clocks().wall_ns;
    if (wall_ns > 0) machine.jumpWallClockNs(-wall_ns);
  }

  const Life life_;
  std::optional<Daemon> daemon_;
};

/// Over all years of a kind.
struct Figures {
  std::size_t fewest_runs = SIZE_MAX;
  std::size_t most_runs = 0;
  std::uint64_t shortest_gap_ns = UINT64_MAX;
  std::uint64_t longest_gap_at_work_ns = 0;
  std::uint64_t most_records_a_day = 0;
  std::uint64_t least_work_days = UINT64_MAX;
  std::uint64_t short_gaps = 0;  ///< of less than 12 hours

  void add(const VirtualMachine& machine) {
    const std::vector<Run> runs = machine.runs();
    fewest_runs = std::min(fewest_runs, runs.size());
    most_runs = std::max(most_runs, runs.size());
    least_work_days = std::min(least_work_days, machine.workNs() / kDay);
    most_records_a_day = std::max(most_records_a_day, machine.recordsSaved() / 365);
    std::uint64_t last_work_ns = 0;
    for (std::size_t i = 0; i < runs.size(); ++i) {
      longest_gap_at_work_ns = std::max(longest_gap_at_work_ns, runs[i].at_work_ns - last_work_ns);
      last_work_ns = runs[i].at_work_ns;
      if (i == 0) continue;
      const std::uint64_t gap_ns = runs[i].at_ns - runs[i - 1].at_ns;
      shortest_gap_ns = std::min(shortest_gap_ns, gap_ns);
      if (gap_ns < 12 * kHour) ++short_gaps;
    }
    longest_gap_at_work_ns = std::max(longest_gap_at_work_ns, machine.workNs() - last_work_ns);
  }
  void print(const char* kind, unsigned years) const {
    std::printf(
        "%s: %u years; %zu to %zu runs a year; gaps from %.2f h to %.2f h at work; at work at "
        "least %llu days; up to %llu records kept a day\n",
        kind, years, fewest_runs, most_runs, static_cast<double>(shortest_gap_ns) / kHour,
        static_cast<double>(longest_gap_at_work_ns) / kHour,
        static_cast<unsigned long long>(least_work_days),
        static_cast<unsigned long long>(most_records_a_day));
  }
};

Figures liveThrough(const char* kind, const Life& life) {
  const LogCapture quiet;
  Figures figures;
  inEverySchedule(yearsToTry(), [&] {
    Year year(life);
    year.live();
    Figures of_this_year;
    of_this_year.add(year.machine);
    figures.add(year.machine);
    EXPECT_GT(of_this_year.most_runs, 0U);
    // A clock that stands too late after a restart looks like a machine that was off.
    EXPECT_LE(of_this_year.short_gaps, year.times_run_off);
    EXPECT_LE(of_this_year.longest_gap_at_work_ns, (life.clock_is_lost ? 98 : 49) * kHour);
  });
  figures.print(kind, yearsToTry());
  return figures;
}

TEST(DailyYear, OfAMachineThatIsLeftAlone) {
  const Figures figures = liveThrough("left alone", {});
  EXPECT_GE(figures.fewest_runs, 364U);
  EXPECT_LE(figures.most_runs, 366U);
  EXPECT_GE(figures.shortest_gap_ns, 23 * kHour);
  EXPECT_LE(figures.longest_gap_at_work_ns, 25 * kHour + kMinute);
}

TEST(DailyYear, WithSuspends) { liveThrough("suspends", {.suspends = true}); }

TEST(DailyYear, OnBatteryMostOfTheTime) { liveThrough("battery", {.battery = true}); }

TEST(DailyYear, WithRestarts) { liveThrough("restarts", {.restarts = true}); }

TEST(DailyYear, WithAWallClockThatIsSet) { liveThrough("clock set", {.clock_is_set = true}); }

TEST(DailyYear, WithAllOfThese) {
  liveThrough("all", {.suspends = true, .battery = true, .restarts = true, .clock_is_set = true});
}

TEST(DailyYear, WithAllOfTheseAndAClockThatIsLostWithTheMachine) {
  liveThrough("clock lost", {.suspends = true,
                             .battery = true,
                             .restarts = true,
                             .clock_is_set = true,
                             .clock_is_lost = true});
}

TEST(DailyYear, WithAllOfTheseAndAClockThatRunsOffWithTheMachine) {
  liveThrough("clock runs off", {.suspends = true,
                                 .battery = true,
                                 .restarts = true,
                                 .clock_is_set = true,
                                 .clock_runs_off = true});
}

}  // namespace
}  // namespace spacekeep::test
