// An honest client that times one small call to each of several peers in turn, until it is ended.
// Usage: soak-probe PAUSE_MS LOG SOCKET...
//
// LOG gets a line for each call: monotonic seconds at its start, the number of the socket from 0,
// microseconds that it took.
#include <fmt/format.h>

#include <cstdio>
#include <cstdlib>
#include <vector>

#include "bench/calls.h"

namespace {

constexpr const char* kKey = "SOAK_PROBE";

void pause(long pause_ms) {
  const timespec duration = {pause_ms / 1000, pause_ms % 1000 * 1'000'000};
  nanosleep(&duration, nullptr);
}

}  // namespace

int main(int count, char** arguments) {
  if (count < 4) return 2;
  const long pause_ms = std::strtol(arguments[1], nullptr, 10);
  std::FILE* log = std::fopen(arguments[2], "w");
  if (log == nullptr) return 1;
  std::setvbuf(log, nullptr, _IOLBF, 0);
  std::vector<bench::Bus> peers;
  for (int i = 3; i < count; ++i) peers.push_back(bench::connectBus(arguments[i]));
  while (true) {
    for (std::size_t i = 0; i < peers.size(); ++i) {
      const double start_us = bench::nowUs();
      const bench::Message reply = bench::getState(peers[i].get(), kKey);
      fmt::print(log, "{:.6f} {} {:.1f}\n", start_us / 1e6, i, bench::nowUs() - start_us);
      pause(pause_ms);
    }
  }
}
