// Checks in many services from one process and keeps them until standard input ends.
// Usage: bench-many-services PREFIX COUNT
#include <fmt/format.h>
#include <spacekeep/service.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <vector>

int main(int count, char** arguments) {
  if (count != 3) return 2;
  namespace sdk = spacekeep::sdk;
  const int services = std::atoi(arguments[2]);
  std::atomic<int> serving{0};
  std::vector<sdk::ServiceHost> hosts;
  for (int i = 0; i < services; ++i) {
    sdk::CheckInOptions options;
    options.on_status = [&serving, services](const sdk::HostStatus& status) {
      if (status.state == sdk::HostState::kServing && ++serving == services) {
        fmt::print("all serving\n");
        std::fflush(stdout);
      }
    };
    auto host = sdk::ServiceHost::checkIn(fmt::format("{}-{}", arguments[1], i),
                                          std::make_shared<sdk::Service>(), options);
    if (!host) return 1;
    hosts.push_back(std::move(*host));
  }
  char byte = 0;
  while (read(0, &byte, 1) > 0) {
  }
  return 0;
}
