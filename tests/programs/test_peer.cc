// A client of few words for tests that need one under another user: prints one line that says how
// the daemon answered. Usage: test-peer purge VOLUME BYTES [wait-all] | check-in ID PATIENCE_MS
#include <spacekeep/client.h>
#include <spacekeep/service.h>

#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <string>

namespace {

using spacekeep::sdk::Client;
using spacekeep::sdk::HostState;
using spacekeep::sdk::ServiceHost;

int purge(const char* volume, const char* bytes, bool finish_early) {
  auto client = Client::connect();
  if (!client) return std::printf("no connection\n"), 1;
  spacekeep::sdk::PurgeRequest request;
  request.volume = volume;
  request.amount = std::strtoull(bytes, nullptr, 10);
  request.finish_early = finish_early;
  const auto reply = client->purge(request);
  if (reply.error) return std::printf("error: %s\n", reply.error->text.c_str()), 1;
  std::printf(reply.refused() ? "no dictionary\n" : "outcome\n");
  return 0;
}

int checkIn(const char* id, const char* patience_ms) {
  spacekeep::sdk::CheckInOptions options;
  options.patience = std::chrono::milliseconds(std::atoi(patience_ms));
  options.on_status = [](const spacekeep::sdk::HostStatus& status) {
    std::printf("%s: %s\n", spacekeep::sdk::textOf(status.state), status.text.c_str());
    std::fflush(stdout);
  };
  auto host = ServiceHost::checkIn(id, std::make_shared<spacekeep::sdk::Service>(), options);
  if (!host) return std::printf("not started\n"), 1;
  host->waitUntilStopped();
  return 0;
}

}  // namespace

int main(int count, char** arguments) {
  const std::string command = count > 3 ? arguments[1] : "";
  if (command == "purge") return purge(arguments[2], arguments[3], count == 4);
  if (command == "check-in") return checkIn(arguments[2], arguments[3]);
  return 2;
}
