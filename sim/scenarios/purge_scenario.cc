#include "sim/scenarios/purge_scenario.h"

#include <algorithm>
#include <set>
#include <utility>

#include "sim/scenarios/random.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

constexpr std::uint64_t kMs = 1'000'000;
constexpr std::uint64_t kSecond = 1'000 * kMs;
constexpr const char* kRoot = "/";
constexpr const char* kOther = "/data";

// Deadlines of the waits are at 2, 6, 12 and 20 seconds after a purge starts: some delays meet
// them.
std::uint64_t drawDelay(Random& random) {
  switch (random.below(10)) {
    case 0:
    case 1:
    case 2:
    case 3:
      return 0;
    case 4:
      return kMs * random.between(1, 50);
    case 5:
      return kSecond * random.between(1, 3);
    case 6:
      return 2 * kSecond;
    case 7:
      return kMs * random.between(100, 9000);
    case 8:
      return kSecond * random.between(5, 40);
    default:
      return 1;
  }
}

Answer drawAnswer(Random& random) {
  const std::uint64_t draw = random.below(100);
  if (draw < 66) return Answer::kReplies;
  if (draw < 71) return Answer::kRepliesWithoutAmount;
  if (draw < 75) return Answer::kRepliesWithText;
  if (draw < 82) return Answer::kFailsBeforeCall;
  if (draw < 89) return Answer::kFailsDuringCall;
  return Answer::kNever;
}

CallBehaviour drawPurgeCall(Random& random) {
  CallBehaviour call;
  call.answer = drawAnswer(random);
  call.delay_ns = drawDelay(random);
  call.percent_given = random.oneOf<std::uint32_t>({100, 100, 100, 100, 50, 0, 99, 130, 250});
  call.percent_reported = random.oneOf<std::uint32_t>({100, 100, 100, 100, 100, 0, 60, 180});
  call.reported_extra = random.oneOf<std::uint64_t>({0, 0, 0, 0, 1, 5000});
  if (random.percent(15)) call.space_returns_after_ns = drawDelay(random);
  if (random.percent(50)) call.end = ConnectionEnd::kInterrupted;
  return call;
}

OwnedBytes drawOwned(Random& random, std::uint64_t about_bytes) {
  OwnedBytes owned{};
  for (std::size_t urgency = 1; urgency < owned.size(); ++urgency) {
    if (random.percent(60)) owned[urgency] = random.below(about_bytes + 1);
  }
  return owned;
}

bool claimsMoreThanItFrees(const CallBehaviour& call) {
  return call.percent_reported > 100 || call.reported_extra > 0 || call.space_returns_after_ns > 0;
}

ServiceBehaviour drawBehaviour(Random& random, std::uint64_t about_bytes) {
  ServiceBehaviour behaviour;
  behaviour.owns[kRoot] = drawOwned(random, about_bytes);
  if (random.percent(30)) behaviour.owns[kOther] = drawOwned(random, about_bytes);
  behaviour.purge.clear();
  const bool plain = random.percent(30);
  const std::uint64_t steps = random.between(1, 3);
  for (std::uint64_t step = 0; step < steps; ++step) {
    behaviour.purge.push_back(plain ? CallBehaviour{} : drawPurgeCall(random));
  }
  // The last entry stands for every later call, see the header for claims without end.
  if (claimsMoreThanItFrees(behaviour.purge.back())) behaviour.purge.emplace_back();
  behaviour.ping.delay_ns = random.percent(20) ? drawDelay(random) : 0;
  if (random.percent(10)) behaviour.cancel.answer = Answer::kNever;
  behaviour.cancel_stops_purge = random.percent(30);
  return behaviour;
}

PlannedService drawService(Random& random, std::size_t index, std::uint64_t about_bytes) {
  PlannedService service;
  // The registry is ordered by ID; the IDs are not in the order of the plan.
  service.id = std::string(1, static_cast<char>('a' + (index * 5 + 3) % 8)) + "-cache";
  service.declared = random.percent(60);
  service.purges = random.percent(88);
  service.behaviour = drawBehaviour(random, about_bytes);
  if (!service.declared) {
    service.check_in_after_ns = random.percent(70) ? 0 : drawDelay(random);
    if (random.percent(20)) service.purges_after_second_check_in = random.percent(50);
  }
  if (random.percent(20)) {
    PlannedEnd end;
    end.after_ns = drawDelay(random);
    end.dies = random.percent(60);
    if (random.percent(50)) end.returns_after_ns = drawDelay(random);
    service.end = end;
  }
  return service;
}

void drawUrgencyLimit(Random& random, Dictionary& info) {
  const char* key = random.percent(70) ? "SPACEKEEP_URGENCY" : "SPACEKEEP_URGENCY_LIMIT";
  const std::uint64_t draw = random.below(12);
  if (draw < 2) return;
  if (draw < 10) {
    info.set(key, random.between(1, 4));
  } else if (draw == 10) {
    info.set(key, random.oneOf<std::int64_t>({0, -1, 5, 9, 1LL << 40}));
  } else {
    info.set(key, "2");
  }
}

std::uint64_t drawAmount(Random& random, std::size_t services) {
  switch (random.below(10)) {
    case 0:
      return random.below(services + 2);  // around one byte for each
    case 1:
      return random.between(1, 40);
    case 2:
      return 1'000'000'000;
    default:
      return random.between(50, 20'000);
  }
}

PlannedPurge drawPurge(Random& random, std::size_t index, std::size_t services,
                       std::set<std::uint64_t>& amounts) {
  PlannedPurge purge;
  purge.after_ns = random.percent(60) ? 0 : drawDelay(random);
  std::uint64_t amount = drawAmount(random, services);
  while (!amounts.insert(amount).second) ++amount;
  Dictionary& info = purge.info;
  info.set("SPACEKEEP_VOLUME", random.percent(85) ? kRoot : kOther);
  info.set("SPACEKEEP_AMOUNT", amount);
  info.set("SPACEKEEP_TOKEN", "purge-" + std::to_string(index));
  drawUrgencyLimit(random, info);
  if (random.percent(30)) info.set("SPACEKEEP_FINISH_EARLY", random.percent(80));
  if (random.percent(25)) {
    info.set("SPACEKEEP_PURGE_TIMEOUT", random.oneOf<std::uint64_t>({0, 1, 3, 10, 300, 1000}));
  }
  if (random.percent(3)) info.set("SPACEKEEP_AMOUNT", "much");
  if (random.percent(2)) info.remove("SPACEKEEP_AMOUNT");
  if (random.percent(3)) info.set("SPACEKEEP_VOLUME", "/nowhere");
  purge.entitled = !random.percent(4);
  if (random.percent(15)) purge.cancelled_after_ns = drawDelay(random);
  return purge;
}

// Much space taken while few bytes are needed means thousands of small requests, one after another.
std::uint64_t largestWrite(const std::set<std::uint64_t>& amounts) {
  return std::clamp<std::uint64_t>(*amounts.begin() * 20, 1, 15'000);
}

PlannedWrite drawWrite(Random& random, std::uint64_t largest_bytes) {
  PlannedWrite write;
  write.after_ns = drawDelay(random);
  write.volume = random.percent(80) ? kRoot : kOther;
  write.bytes = random.between(1, largest_bytes);
  write.frees = random.percent(35);
  return write;
}

std::string secondsOf(std::uint64_t ns) { return std::to_string(static_cast<double>(ns) / 1e9); }

std::string textOf(const PlannedService& service) {
  std::string text =
      service.id +
      (service.declared ? " declared"
                        : " checks in after " + secondsOf(service.check_in_after_ns)) +
      (service.purges ? "" : ", does not purge");
  if (service.purges_after_second_check_in) {
    text += *service.purges_after_second_check_in ? ", again purging" : ", again not purging";
  }
  for (const auto& [volume, owned] : service.behaviour.owns) {
    text += ", owns on " + volume;
    for (std::size_t urgency = 1; urgency < owned.size(); ++urgency) {
      text += " " + std::to_string(owned[urgency]);
    }
  }
  for (const CallBehaviour& call : service.behaviour.purge) {
    text += "; call: answer " + std::to_string(static_cast<int>(call.answer)) + " after " +
            secondsOf(call.delay_ns) + " gives " + std::to_string(call.percent_given) +
            "% reports " + std::to_string(call.percent_reported) + "% + " +
            std::to_string(call.reported_extra);
    if (call.space_returns_after_ns != 0) {
      text += ", space back after " + secondsOf(call.space_returns_after_ns);
    }
  }
  if (service.end) {
    text += std::string("; ") + (service.end->dies ? "dies" : "closes") + " after " +
            secondsOf(service.end->after_ns);
    if (service.end->returns_after_ns) {
      text += ", back after " + secondsOf(*service.end->returns_after_ns);
    }
  }
  return text;
}

}  // namespace

PurgeScenario derivePurgeScenario(std::uint64_t seed) {
  Random random(seed);
  PurgeScenario scenario;
  scenario.parallelism = random.oneOf<std::size_t>({1, 2, 4, 4, 8});
  scenario.volumes = {{kRoot, 1'000'000'000'000, random.between(0, 1'000'000)},
                      {kOther, 1'000'000'000, random.between(0, 100'000)}};
  const std::size_t services = random.between(1, 8);
  const std::uint64_t about_bytes = random.oneOf<std::uint64_t>({200, 2'000, 10'000});
  for (std::size_t index = 0; index < services; ++index) {
    scenario.services.push_back(drawService(random, index, about_bytes));
  }
  const std::size_t purges = random.percent(60) ? 1 : random.between(2, 3);
  std::set<std::uint64_t> amounts;
  for (std::size_t index = 0; index < purges; ++index) {
    scenario.purges.push_back(drawPurge(random, index, services, amounts));
  }
  const std::size_t writes = random.percent(50) ? 0 : random.between(1, 4);
  for (std::size_t index = 0; index < writes; ++index) {
    scenario.writes.push_back(drawWrite(random, largestWrite(amounts)));
  }
  return scenario;
}

std::string textOf(const PurgeScenario& scenario) {
  std::string text = "parallelism " + std::to_string(scenario.parallelism) + "\n";
  for (const PlannedService& service : scenario.services) text += textOf(service) + "\n";
  for (const PlannedPurge& purge : scenario.purges) {
    text += "purge after " + secondsOf(purge.after_ns) + " " + textOf(purge.info) +
            (purge.entitled ? "" : " without the right") + "\n";
  }
  for (const PlannedWrite& write : scenario.writes) {
    text += std::string(write.frees ? "space comes back" : "somebody writes") + " after " +
            secondsOf(write.after_ns) + " on " + write.volume + ": " + std::to_string(write.bytes) +
            "\n";
  }
  return text;
}

}  // namespace spacekeep::sim
