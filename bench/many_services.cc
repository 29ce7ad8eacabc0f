// Checks in many services from one process and keeps them until standard input ends.
// Usage: bench-many-services PREFIX COUNT [SOCKET]
#include <fmt/format.h>
#include <spacekeep/service.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <vector>

namespace sdk = spacekeep::sdk;

namespace {

class HasOneMib : public sdk::Service {
 public:
  sdk::Answer purgeable(const sdk::Job&) override { return {.amount = 1'048'576, .more = {}}; }
};

}  // namespace

int main(int count, char** arguments) {
  if (count < 3) return 2;
  const int services = std::atoi(arguments[2]);
  std::atomic<int> serving{0};
  std::vector<sdk::ServiceHost> hosts;
  for (int i = 0; i < services; ++i) {
    sdk::CheckInOptions options;
    if (count > 3) options.socket_path = arguments[3];
    options.on_status = [&serving, services](const sdk::HostStatus& status) {
      if (status.state == sdk::HostState::kServing && ++serving == services) {
        fmt::print("all serving\n");
        std::fflush(stdout);
      }
    };
    auto host = sdk::ServiceHost::checkIn(fmt::format("{}-{}", arguments[1], i),
                                          std::make_shared<HasOneMib>(), options);
    if (!host) return 1;
    hosts.push_back(std::move(*host));
  }
  char byte = 0;
  while (read(0, &byte, 1) > 0) {
  }
  return 0;
}
