// A client: makes room for a download.
#include <spacekeep/client.h>

#include <chrono>
#include <cstdio>

using spacekeep::sdk::Client;
using spacekeep::sdk::PurgeRequest;

int main() {
  auto client = Client::connect();
  if (!client) return std::fprintf(stderr, "%s\n", client.error().text.c_str()), 1;

  PurgeRequest request;
  request.volume = "/data";
  request.amount = 20'000'000;  // bytes
  request.urgency = 2;          // do not go further than this
  request.finish_early = true;  // answer as soon as the amount is there
  const auto reply = client->purge(request, std::chrono::seconds(30));

  if (reply.error) return std::fprintf(stderr, "%s\n", reply.error->text.c_str()), 1;
  if (reply.refused()) return std::fprintf(stderr, "refused\n"), 1;
  const auto freed = spacekeep::unsignedAt(*reply.outcome, "SPACEKEEP_AMOUNT").value_or(0);
  std::printf("%llu bytes were freed\n", static_cast<unsigned long long>(freed));
  return freed >= request.amount ? 0 : 1;
}
