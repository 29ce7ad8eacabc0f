// Honest clients at a steady rate, each on a connection and a thread of its own.
// Usage: soak-clients PREFIX COUNT CALLS_PER_SECOND_EACH SECONDS PROGRESS VOLUME...
//
// One client in five purges and queries, the others read and write state and cancel. The file
// PROGRESS always holds the number of purges and queries answered so far. At the end one line says how many calls
// of each kind were answered and how many failed.
#include <fmt/format.h>
#include <spacekeep/client.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <random>
#include <string>
#include <thread>
#include <vector>

namespace sdk = spacekeep::sdk;
using Clock = std::chrono::steady_clock;

namespace {

struct Counts {
  std::atomic<long> purges{0}, queries{0}, reads{0}, writes{0}, cancels{0}, failed{0};
  std::atomic<unsigned> running{0};

  [[nodiscard]] long workAnswered() const { return purges + queries; }
};

class OneClient {
 public:
  OneClient(std::string name, unsigned seed, std::vector<std::string> volumes, Counts& counts)
      : name_(std::move(name)), random_(seed), volumes_(std::move(volumes)), counts_(counts) {}

  void run(double calls_per_second, Clock::time_point end) {
    auto client = sdk::Client::connect();
    if (!client) return fail(client.error().text);
    const bool is_heavy = random_() % 5 == 0;
    const std::chrono::duration<double> pause(1 / calls_per_second);
    auto next = Clock::now();
    while (Clock::now() < end && client->connected()) {
      is_heavy ? callHeavily(*client) : callLightly(*client);
      next = std::max(next + std::chrono::duration_cast<Clock::duration>(pause), Clock::now());
      std::this_thread::sleep_until(next);
    }
    if (!client->connected()) fail("the connection was lost");
  }

 private:
  void callHeavily(sdk::Client& client) {
    const std::string& volume = volumes_[random_() % volumes_.size()];
    if (random_() % 2 == 0) {
      return book(client.purgeableSpace({{"SPACEKEEP_VOLUME", volume}}), counts_.queries);
    }
    book(client.purge({.volume = volume,
                       .amount = (1 + random_() % 8) * 262'144,
                       .urgency = 2,
                       .timeout_seconds = 3,
                       .token = {},
                       .finish_early = true}),
         counts_.purges);
  }

  void callLightly(sdk::Client& client) {
    const unsigned kind = static_cast<unsigned>(random_() % 10);
    if (kind < 6) {
      const sdk::StateReply reply = client.state(name_);
      return book(reply.error, counts_.reads);
    }
    if (kind < 8) {
      const std::string text(random_() % 500, 'x');
      return book(client.setState(name_, spacekeep::Value(text)).error, counts_.writes);
    }
    book(client.cancel(spacekeep::Value(name_)).error, counts_.cancels);
  }

  void book(const sdk::Reply& reply, std::atomic<long>& answered) {
    if (reply.outcome && !reply.outcome->contains("SPACEKEEP_ERROR")) {
      ++answered;
    } else {
      fail(reply.error ? reply.error->text : "no dictionary, or one with an error");
    }
  }
  void book(const std::optional<sdk::Error>& error, std::atomic<long>& answered) {
    if (!error) {
      ++answered;
    } else {
      fail(error->text);
    }
  }
  void fail(const std::string& why) {
    ++counts_.failed;
    fmt::print(stderr, "{}: {}\n", name_, why);
  }

  const std::string name_;
  std::mt19937 random_;
  const std::vector<std::string> volumes_;
  Counts& counts_;
};

/// The digits only ever get more, so whoever reads in between sees the old number or the new one.
void tell(const char* path, long answered) {
  std::FILE* file = std::fopen(path, "r+");
  if (file == nullptr) return;
  fmt::print(file, "{:012}\n", answered);
  std::fclose(file);
}

}  // namespace

int main(int count, char** arguments) {
  if (count < 7) return 2;
  const std::string prefix = arguments[1];
  const unsigned clients = static_cast<unsigned>(std::strtoul(arguments[2], nullptr, 10));
  const double rate = std::strtod(arguments[3], nullptr);
  const auto end = Clock::now() + std::chrono::seconds(std::strtol(arguments[4], nullptr, 10));
  const char* progress = arguments[5];
  const std::vector<std::string> volumes(arguments + 6, arguments + count);
  Counts counts;
  counts.running = clients;
  std::vector<std::thread> threads;
  for (unsigned i = 0; i < clients; ++i) {
    threads.emplace_back([&counts, &prefix, &volumes, i, rate, end] {
      OneClient(fmt::format("{}-{}", prefix, i), i + 1, volumes, counts).run(rate, end);
      --counts.running;
    });
  }
  while (counts.running > 0) {
    tell(progress, counts.workAnswered());
    std::this_thread::sleep_for(std::chrono::seconds(1));
  }
  for (std::thread& thread : threads) thread.join();
  fmt::print(
      "clients: {} purges, {} queries, {} state reads, {} state writes, {} cancels, {} failed\n",
      counts.purges.load(), counts.queries.load(), counts.reads.load(), counts.writes.load(),
      counts.cancels.load(), counts.failed.load());
  return counts.failed == 0 ? 0 : 1;
}
