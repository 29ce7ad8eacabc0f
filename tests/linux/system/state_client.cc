#include "tests/linux/system/state_client.h"

#include <ctime>
#include <utility>

#include "support/runtime/runtime.h"

namespace spacekeep::system_test {

std::uint64_t monotonicMs() {
  timespec now = {};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<std::uint64_t>(now.tv_sec) * 1000 +
         static_cast<std::uint64_t>(now.tv_nsec) / 1'000'000;
}

std::unique_ptr<sdk::Client> connectToStarting(const Sandbox& sandbox) {
  const std::uint64_t deadline_ms = monotonicMs() + 60'000;
  while (monotonicMs() < deadline_ms) {
    auto client = sdk::Client::connect({.socket_path = sandbox.socketPath(), .on_disconnect = {}});
    if (client && !client->state("SPACEKEEP_CACHE_ENABLED").error) {
      return std::make_unique<sdk::Client>(std::move(*client));
    }
    rt::sleepNs(1'000'000);  // until the daemon listens
  }
  return nullptr;
}

}  // namespace spacekeep::system_test
