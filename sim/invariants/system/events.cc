// Invariants on what outside events set off: low space, the daily activity, keep-alive.
#include <algorithm>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/registry_model.h"
#include "sim/invariants/system/system_invariants.h"
#include "support/values/text.h"

namespace spacekeep::sim {
namespace {

using formats::textField;

constexpr std::uint64_t kLowSpaceBytes = 250ULL * 1024 * 1024;
constexpr std::uint64_t kLongestPassNs = 15'000'000'000;
constexpr std::int32_t kRunState = 2;
constexpr std::uint64_t kLowDiskFlag = 0x4;
constexpr std::uint64_t kVeryLowDiskFlag = 0x200;

using Counts = std::map<std::string, std::uint64_t>;

/// Which volumes are low may change before an event is handled, in the moment in which it is sent.
bool isClear(const Life& life, std::size_t sent_at) {
  const auto& low = life.as<StreamEventSent>(sent_at)->low_volumes;
  for (std::size_t at = life.firstOfMoment(sent_at); at <= life.lastOfMoment(sent_at); ++at) {
    const auto* other = life.as<StreamEventSent>(at);
    if (other != nullptr && other->low_volumes != low) return false;
  }
  return true;
}

/// None when the trace leaves open what an event found.
std::optional<Counts> duePurges(const SystemStory& story, const Life& life) {
  Counts due;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* sent = life.as<StreamEventSent>(at);
    if (sent == nullptr) continue;
    if (!isClear(life, at)) return std::nullopt;
    for (const std::string& volume : sent->low_volumes) {
      if (story.volumes.contains(volume)) ++due[volume];
    }
  }
  return due;
}

bool wasLowBefore(const Life& life, const std::string& volume, std::size_t before) {
  for (std::size_t at = 0; at < before; ++at) {
    const auto* sent = life.as<StreamEventSent>(at);
    if (sent == nullptr) continue;
    const auto& low = sent->low_volumes;
    if (std::find(low.begin(), low.end(), volume) != low.end()) return true;
  }
  return false;
}

std::string statisticOf(const StreamEventSent& sent) {
  const std::uint64_t flags = unsignedAt(sent.event, "_Flags").value_or(0);
  if (sent.low_volumes.empty()) return {};
  if ((flags & kLowDiskFlag) != 0) return "SK_LOWDISK_EVENT";
  return (flags & kVeryLowDiskFlag) != 0 ? "SK_VERYLOWDISK_EVENT" : "";
}

std::int64_t openAt(const Life& life, std::size_t at) {
  for (std::size_t i = at + 1; i-- > 0;) {
    if (const auto* keep = life.as<KeepAliveIs>(i)) return keep->open;
  }
  return 0;
}

/// The passes of one daily activity, which one thread makes.
struct PassOfVolume {
  std::size_t begin_at = kNowhere;
  std::set<std::string> asked;
};

void finishPass(const Life& life, const PassOfVolume& pass, std::size_t at, Findings& findings) {
  if (pass.begin_at == kNowhere || life.registryWaited(pass.begin_at, at)) return;
  const std::uint64_t took_ns = life.timeAt(at) - life.timeAt(pass.begin_at);
  if (took_ns > kLongestPassNs) {
    findings.push_back("a periodic pass took " + std::to_string(took_ns) + " ns");
  }
}

}  // namespace

void checkLowSpace(const SystemStory& story, const Life& life, Findings& findings) {
  Counts ran;
  for (const Operation& operation : life.purges->operations) {
    if (!isLowSpacePurge(operation.request)) continue;
    const std::string* volume = stringAt(operation.request, "SPACEKEEP_VOLUME");
    if (volume == nullptr || !wasLowBefore(life, *volume, operation.begin_at)) {
      findings.push_back("low space purged " + (volume == nullptr ? "nothing" : *volume) +
                         ", which was not low");
      continue;
    }
    ++ran[*volume];
    if (operation.needed != kLowSpaceBytes) {
      findings.push_back("low space purged " + std::to_string(operation.needed) + " bytes");
    }
  }
  const auto due = duePurges(story, life);
  if (!due || life.cut || ran == *due) return;
  std::string text = "low space purged";
  for (const auto& [volume, times] : ran) text += " " + volume + " " + std::to_string(times) + " x";
  text += ", due were";
  for (const auto& [volume, times] : *due)
    text += " " + volume + " " + std::to_string(times) + " x";
  findings.push_back(text);
}

void checkLowSpaceStatistics(const SystemStory& story, const Life& life, Findings& findings) {
  if (!duePurges(story, life)) return;
  Counts due;
  Counts counted;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    if (const auto* sent = life.as<StreamEventSent>(at)) {
      const std::string key = statisticOf(*sent);
      if (!key.empty()) ++due[key];
    } else if (const auto* statistic = life.as<StatisticSent>(at)) {
      if (statistic->key.starts_with("SK_")) {
        counted[statistic->key] += static_cast<std::uint64_t>(statistic->count);
      }
    }
  }
  if (counted == due) return;
  for (const char* key : {"SK_LOWDISK_EVENT", "SK_VERYLOWDISK_EVENT"}) {
    findings.push_back(std::string(key) + " was counted " + std::to_string(counted[key]) +
                       " times for " + std::to_string(due[key]) + " events");
  }
}

// Each activity visits its volumes one after the other, on one thread.
void checkPeriodicPasses(const SystemStory&, const Life& life, Findings& findings) {
  std::map<unsigned, PassOfVolume> passes;
  std::uint64_t ended = 0;
  std::uint64_t due = 0;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    if (const auto* ran = life.as<ActivityRan>(at)) {
      if (ran->state == kRunState) due += ran->local_volumes.size();
    }
    const auto* line = life.as<LogLine>(at);
    if (line == nullptr) continue;
    PassOfVolume& pass = passes[life.events[at].thread];
    if (line->format == formats::kPeriodicCalling) {
      if (pass.begin_at == kNowhere) pass.begin_at = at;
      if (!pass.asked.insert(textField(*line, 1)).second) {
        findings.push_back(textField(*line, 1) + " was asked twice by one periodic pass");
      }
    } else if (line->format == formats::kPeriodicResult) {
      finishPass(life, pass, at, findings);
      ++ended;
      pass = {};
    }
  }
  if (ended > due || (ended < due && !life.cut)) {
    findings.push_back(std::to_string(ended) + " periodic passes ended, " + std::to_string(due) +
                       " were due");
  }
}

void checkPeriodicRequests(const SystemStory& story, const Life& life, Findings& findings) {
  const RegistryModel registry(story, life);
  std::uint64_t activities = 0;
  std::map<std::string, std::uint64_t> asked_times;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* ran = life.as<ActivityRan>(at);
    if (ran != nullptr && ran->state == kRunState) ++activities;
    const auto* asked = life.as<ServiceAsked>(at);
    if (asked == nullptr || asked->member != "servicePeriodic") continue;
    const std::string* volume = stringAt(asked->info, "SPACEKEEP_VOLUME");
    if (asked->urgency != 3 || volume == nullptr || asked->info.size() != 1 ||
        !story.volumes.contains(*volume)) {
      findings.push_back(asked->service + " got a periodic request of urgency " +
                         std::to_string(asked->urgency) + ": " + textOf(asked->info));
      continue;
    }
    const std::uint64_t times = ++asked_times[asked->service + " for " + *volume];
    if (times > activities) {
      findings.push_back(asked->service + " was asked " + std::to_string(times) +
                         " times for periodic work on " + *volume);
    }
    if (!registry.mayHavePeriodicWork(asked->service, at)) {
      findings.push_back(asked->service + " was asked for periodic work and is to be left out");
    }
  }
}

void checkKeepAlive(const SystemStory&, const Life& life, Findings& findings) {
  if (life.facts->keep_alive_went_negative) {
    findings.push_back("more transactions were ended than begun");
  }
  if (!life.cut && life.facts->keep_alive_open != 0) {
    findings.push_back(std::to_string(life.facts->keep_alive_open) +
                       " transactions are open at the end");
  }
  for (const Operation& operation : life.purges->operations) {
    if (!isLowSpacePurge(operation.request)) continue;
    if (openAt(life, operation.begin_at) > 0) continue;
    findings.push_back("a purge for low space runs without a keep-alive transaction");
  }
}

}  // namespace spacekeep::sim
