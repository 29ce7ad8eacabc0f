// A service for tests that is started with a listening socket, as the service manager starts one:
// prints its states, and stops by itself after IDLE_MS without a request. Usage: socket-service
// IDLE_MS
#include <spacekeep/service.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>

namespace {

using namespace spacekeep::sdk;

class Echo : public Service {
 public:
  Answer purge(const Job& job) override { return {.amount = job.amount, .more = {}}; }
};

}  // namespace

int main(int count, char** arguments) {
  SocketOptions options;
  if (count > 1) options.stop_when_idle = std::chrono::milliseconds(std::atoi(arguments[1]));
  auto host = ServiceHost::serveSocket(std::make_shared<Echo>(), options);
  if (!host) return std::printf("%s\n", host.error().text.c_str()), 1;
  host->waitUntilStopped();
  std::printf("%s\n", textOf(host->status().state));
  return 0;
}
