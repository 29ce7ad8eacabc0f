// The same call to two peers in turn, and the ratio of what it took.
// Usage: bench-small-call SOCKET FLOOR_SOCKET KIND ROUNDS
// KIND: cancel, state (a value of some 20 bytes), query (answered from memory by the daemon)
#include <fmt/format.h>

#include <string_view>

#include "bench/calls.h"

namespace {

constexpr const char* kStateKey = "SMALL_STATE_VALUE";

struct Kind {
  std::string_view name;
  const char* figure;
  double target;
  int calls_per_round;
  bench::Message (*call)(sd_bus* bus);
};

bench::Message getSmallState(sd_bus* bus) { return bench::getState(bus, kStateKey); }
bench::Message queryFromMemory(sd_bus* bus) { return bench::query(bus); }

constexpr Kind kKinds[] = {
    {"cancel", "small_call", 1.2, 500, bench::cancelNothing},
    {"state", "get_state", 1.3, 500, getSmallState},
    {"query", "query_from_memory", 1.5, 10, queryFromMemory},
};

const Kind* kindNamed(std::string_view name) {
  for (const Kind& kind : kKinds) {
    if (kind.name == name) return &kind;
  }
  return nullptr;
}

void runRound(const Kind& kind, sd_bus* bus, std::vector<double>& times_us) {
  for (int i = 0; i < kind.calls_per_round; ++i) {
    const double start = bench::nowUs();
    const bench::Message reply = kind.call(bus);
    times_us.push_back(bench::nowUs() - start);
  }
}

// The comparison is void when the two say different things.
void checkSameAnswer(const Kind& kind, sd_bus* peer, sd_bus* floor) {
  if (kind.name == "state") {
    for (sd_bus* bus : {peer, floor}) {
      const char* text = nullptr;
      const bench::Message reply = kind.call(bus);
      bench::check(sd_bus_message_read(reply.get(), "av", 1, "s", &text), "value of the state");
      if (std::string_view(text) != "twenty bytes of text") bench::check(-EBADMSG, "state value");
    }
  } else if (kind.name == "query") {
    const int from_peer = bench::entriesIn(kind.call(peer).get());
    const int from_floor = bench::entriesIn(kind.call(floor).get());
    fmt::print("entries in the answer: daemon {}, bare {}\n", from_peer, from_floor);
    if (from_peer != from_floor) bench::check(-EBADMSG, "answers differ");
  }
}

void report(const Kind& kind, const std::vector<double>& peer_us,
            const std::vector<double>& floor_us) {
  fmt::print(
      "{} calls each; daemon p50 {:.1f} us p99 {:.1f} us; bare sd-bus p50 {:.1f} us p99 {:.1f} "
      "us\n",
      peer_us.size(), bench::percentile(peer_us, 0.5), bench::percentile(peer_us, 0.99),
      bench::percentile(floor_us, 0.5), bench::percentile(floor_us, 0.99));
  fmt::print("figure {}_p50_ratio {:.3f} {}\n", kind.figure,
             bench::percentile(peer_us, 0.5) / bench::percentile(floor_us, 0.5), kind.target);
  fmt::print("figure {}_p99_ratio {:.3f} -\n", kind.figure,
             bench::percentile(peer_us, 0.99) / bench::percentile(floor_us, 0.99));
}

}  // namespace

int main(int count, char** arguments) {
  const Kind* kind = count == 5 ? kindNamed(arguments[3]) : nullptr;
  if (kind == nullptr) return 2;
  const bench::Bus peer = bench::connectBus(arguments[1]);
  const bench::Bus floor = bench::connectBus(arguments[2]);
  if (kind->name == "state") bench::setState(peer.get(), kStateKey, "twenty bytes of text");
  std::vector<double> peer_us;
  std::vector<double> floor_us;
  runRound(*kind, peer.get(), peer_us);  // warm-up
  runRound(*kind, floor.get(), floor_us);
  peer_us.clear();
  floor_us.clear();
  for (int rounds = std::atoi(arguments[4]); rounds > 0; --rounds) {
    runRound(*kind, peer.get(), peer_us);
    runRound(*kind, floor.get(), floor_us);
  }
  checkSameAnswer(*kind, peer.get(), floor.get());
  report(*kind, peer_us, floor_us);
}
