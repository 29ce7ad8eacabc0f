// The same small call to two peers in turn, and the ratio of what it took.
// Usage: bench-small-call SOCKET FLOOR_SOCKET [ROUNDS]
#include <fmt/format.h>

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <vector>

#include "bench/sd_bus_handles.h"

namespace {

constexpr int kCallsPerRound = 500;

double nowUs() {
  timespec now = {};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<double>(now.tv_sec) * 1e6 + static_cast<double>(now.tv_nsec) / 1e3;
}

void callOnce(sd_bus* bus) {
  sd_bus_message* raw = nullptr;
  bench::check(
      sd_bus_message_new_method_call(bus, &raw, nullptr, "/com/quorvel/Spacekeep",
                                     "com.quorvel.SpacekeepClientProtocol", "clientCancelPurge"),
      "new call");
  const bench::Message call(raw);
  bench::check(sd_bus_message_append(raw, "a{sv}", 1, "SPACEKEEP_TOKEN", "s", "none"), "append");
  sd_bus_message* reply = nullptr;
  bench::check(sd_bus_call(bus, raw, 0, nullptr, &reply), "clientCancelPurge");
  const bench::Message answer(reply);
}

void runRound(sd_bus* bus, std::vector<double>& times_us) {
  for (int i = 0; i < kCallsPerRound; ++i) {
    const double start = nowUs();
    callOnce(bus);
    times_us.push_back(nowUs() - start);
  }
}

double percentile(std::vector<double>& values, double share) {
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(share * static_cast<double>(values.size() - 1))];
}

}  // namespace

int main(int count, char** arguments) {
  if (count < 3) return 2;
  const int rounds = count > 3 ? std::atoi(arguments[3]) : 40;
  const bench::Bus peer = bench::connectBus(arguments[1]);
  const bench::Bus floor = bench::connectBus(arguments[2]);
  std::vector<double> peer_us;
  std::vector<double> floor_us;
  runRound(peer.get(), peer_us);  // warm-up
  runRound(floor.get(), floor_us);
  peer_us.clear();
  floor_us.clear();
  for (int i = 0; i < rounds; ++i) {
    runRound(peer.get(), peer_us);
    runRound(floor.get(), floor_us);
  }
  fmt::print(
      "{} calls each; daemon p50 {:.1f} us p99 {:.1f} us; bare sd-bus p50 {:.1f} us p99 {:.1f} "
      "us\n",
      peer_us.size(), percentile(peer_us, 0.5), percentile(peer_us, 0.99),
      percentile(floor_us, 0.5), percentile(floor_us, 0.99));
  fmt::print("figure small_call_p50_ratio {:.3f} 1.2\n",
             percentile(peer_us, 0.5) / percentile(floor_us, 0.5));
  fmt::print("figure small_call_p99_ratio {:.3f} -\n",
             percentile(peer_us, 0.99) / percentile(floor_us, 0.99));
}
