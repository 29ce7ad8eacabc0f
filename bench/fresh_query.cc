// Queries for which every service is asked afresh, in turn with the bare loops over as many
// services of the same kind. Usage: bench-fresh-query SOCKET FLOOR_SOCKET SERVICES ROUNDS
//
// Prints the medians, and "services N daemon_us D one_by_one_us B all_at_once_us P missing M" per
// round. A round in which the daemon's answer lacks a service is void and does not count.
#include <fmt/format.h>

#include "bench/calls.h"

namespace {

constexpr int kEntriesBesideServices = 2;  // the total and the volume

struct Timed {
  double us = 0;
  int services = 0;
};

Timed timedQuery(sd_bus* bus, const char* member) {
  const double start = bench::nowUs();
  const bench::Message answer = bench::query(bus, member);
  const double took_us = bench::nowUs() - start;
  return {took_us, bench::entriesIn(answer.get()) - kEntriesBesideServices};
}

void forgetAnswers(sd_bus* daemon) {
  bench::setState(daemon, "SPACEKEEP_RECENT_SERVICE_STATS", nullptr);
}

struct Times {
  std::vector<double> daemon_us;
  std::vector<double> one_by_one_us;
  std::vector<double> all_at_once_us;
  int void_rounds = 0;
};

void runRound(sd_bus* daemon, sd_bus* floor, int services, Times& times) {
  forgetAnswers(daemon);
  const Timed through = timedQuery(daemon, "clientPurgeableSpace");
  const Timed one_by_one = timedQuery(floor, "clientPurgeableSpace");
  const Timed all_at_once = timedQuery(floor, "clientItemizedPurgeableSpace");
  fmt::print("services {} daemon_us {:.0f} one_by_one_us {:.0f} all_at_once_us {:.0f} missing {}\n",
             services, through.us, one_by_one.us, all_at_once.us, services - through.services);
  if (one_by_one.services != services || all_at_once.services != services) {
    bench::check(-EBADMSG, "the bare loop lacks services");
  }
  if (through.services != services) {
    ++times.void_rounds;
    return;
  }
  times.daemon_us.push_back(through.us);
  times.one_by_one_us.push_back(one_by_one.us);
  times.all_at_once_us.push_back(all_at_once.us);
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 5) return 2;
  const bench::Bus daemon = bench::connectBus(arguments[1]);
  const bench::Bus floor = bench::connectBus(arguments[2]);
  const int services = std::atoi(arguments[3]);
  Times warm_up;
  runRound(daemon.get(), floor.get(), services, warm_up);
  Times times;
  for (int rounds = std::atoi(arguments[4]); rounds > 0; --rounds) {
    runRound(daemon.get(), floor.get(), services, times);
  }
  const double one_by_one_us = bench::percentile(times.one_by_one_us, 0.5);
  const double all_at_once_us = bench::percentile(times.all_at_once_us, 0.5);
  const double daemon_us = bench::percentile(times.daemon_us, 0.5);
  fmt::print(
      "median of {} rounds with {} services ({} void): daemon {:.0f} us, bare loop that "
      "waits for each answer {:.0f} us, bare loop that asks all first {:.0f} us\n",
      times.daemon_us.size(), services, times.void_rounds, daemon_us, one_by_one_us,
      all_at_once_us);
  if (times.daemon_us.empty()) {
    fmt::print("ratio one_by_one void\nratio all_at_once void\n");
    return 1;
  }
  fmt::print("point {} {:.0f}\n", services, daemon_us);
  fmt::print("ratio one_by_one {:.3f}\n", daemon_us / one_by_one_us);
  fmt::print("ratio all_at_once {:.3f}\n", daemon_us / all_at_once_us);
  return times.void_rounds == 0 ? 0 : 1;
}
