// A service that the service manager starts when the daemon first calls it.
#include <spacekeep/service.h>

#include <chrono>
#include <cstdio>
#include <memory>

class Cache : public spacekeep::sdk::Service {
  // The handlers, as in the example before.
};

int main() {
  spacekeep::sdk::SocketOptions options;
  options.stop_when_idle = std::chrono::minutes(1);  // the service manager starts it again
  auto host = spacekeep::sdk::ServiceHost::serveSocket(std::make_shared<Cache>(), options);
  if (!host) return std::fprintf(stderr, "%s\n", host.error().text.c_str()), 1;
  host->waitUntilStopped();
  return 0;
}
