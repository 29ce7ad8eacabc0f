// Invariants on services: who is purged, which registry a purge works on, who is pinged.
#include <algorithm>

#include "sim/invariants/log_formats.h"
#include "sim/invariants/system/registry_model.h"
#include "sim/invariants/system/system_invariants.h"

namespace spacekeep::sim {
namespace {

bool hasAskedServices(const PurgeStory& story, const Operation& operation) {
  return story.namedAllServices(operation) &&
         std::any_of(operation.passes.begin(), operation.passes.end(),
                     [](const Pass& pass) { return pass.asked_at != kNowhere; });
}

const Call* callOf(const Life& life, const Operation& operation) {
  for (const Call& call : life.calls) {
    const bool is_its = call.member == "clientPurge" && call.info &&
                        *call.info == operation.request && call.asked_at < operation.begin_at;
    if (is_its) return &call;
  }
  return nullptr;
}

/// The snapshot of a request is taken as it arrives, unless the registry is waiting.
void checkSnapshotOf(const SystemStory& story, const Life& life, const RegistryModel& registry,
                     const Operation& operation, const Call& call, Findings& findings) {
  std::size_t moment = life.lastOfMoment(call.asked_at);
  // While a write to the disk keeps a thread busy, another one may have to be found first.
  const std::uint64_t writing_ns = 2 * story.run.plan.disk_write_ns;
  while (moment + 1 < life.events.size() &&
         life.timeAt(moment + 1) - life.timeAt(call.asked_at) <= writing_ns) {
    ++moment;
  }
  if (life.registryWaited(call.asked_at, moment)) return;
  for (const std::string& service : operation.services) {
    if (story.declared.contains(service) || registry.mayPurge(service, moment + 1)) continue;
    findings.push_back(life.purges->name(operation) + " works on a snapshot with " + service +
                       ", which came only after " + nameOf(call));
  }
  if (!hasAskedServices(*life.purges, operation)) return;
  for (const std::string& service : registry.surelyPurging(call.asked_at)) {
    if (operation.services.contains(service)) continue;
    findings.push_back(life.purges->name(operation) + " left out " + service);
  }
}

/// Whether the service's connection ended between two check-ins, at moments of their own.
bool wentBetween(const Life& life, const Call& first, const Call& second) {
  for (std::size_t at = first.answeredAt(); at < second.asked_at; ++at) {
    const auto* changed = life.as<WorldChanged>(at);
    if (changed == nullptr) continue;
    const bool goes = changed->what == first.text + " dies" ||
                      changed->what == first.text + " closes its connections";
    if (goes && life.timeAt(at) < life.timeAt(second.asked_at)) {
      return !life.registryWaited(at, second.asked_at);
    }
  }
  return false;
}

std::size_t pingsOf(const Life& life, const std::string& service) {
  std::size_t pings = 0;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* asked = life.as<ServiceAsked>(at);
    if (asked != nullptr && asked->member == "servicePing" && asked->service == service) ++pings;
  }
  return pings;
}

}  // namespace

void checkOnlyServicesThatPurgeArePurged(const SystemStory& story, const Life& life,
                                         Findings& findings) {
  const RegistryModel registry(story, life);
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* asked = life.as<ServiceAsked>(at);
    if (asked == nullptr || asked->member != "servicePurge") continue;
    if (registry.mayPurge(asked->service, at)) continue;
    findings.push_back(asked->service + " does not purge and was asked to");
  }
}

void checkSnapshotIsOfTheRequest(const SystemStory& story, const Life& life, Findings& findings) {
  const RegistryModel registry(story, life);
  for (const Operation& operation : life.purges->operations) {
    const Call* call = callOf(life, operation);
    if (call != nullptr) {
      checkSnapshotOf(story, life, registry, operation, *call, findings);
    }
  }
}

void checkPings(const SystemStory& story, const Life& life, Findings& findings) {
  const RegistryModel registry(story, life);
  std::size_t existing = 0;
  for (std::size_t at = 0; at < life.events.size(); ++at) {
    const auto* line = life.as<LogLine>(at);
    if (line != nullptr && line->format == formats::kExistingService) ++existing;
  }
  if (life.pings.size() + existing != registry.checkIns().size()) {
    findings.push_back(std::to_string(life.pings.size()) + " pings and " +
                       std::to_string(existing) + " known services for " +
                       std::to_string(registry.checkIns().size()) + " check-ins");
  }
  std::map<std::string, std::size_t> returns;
  std::map<std::string, const Call*> last;
  for (const Call* call : registry.checkIns()) {
    const auto before = last.find(call->text);
    if (before != last.end() && before->second->answeredAt() < call->asked_at &&
        wentBetween(life, *before->second, *call)) {
      ++returns[call->text];
    }
    last[call->text] = call;
  }
  for (const auto& [service, call] : last) {
    const std::size_t pings = pingsOf(life, service);
    if (pings < returns[service] + 1) {
      findings.push_back(service + " came back " + std::to_string(returns[service]) +
                         " times and was pinged " + std::to_string(pings) + " times");
    }
    if (registry.endedConnections() == 0 && pings > 1) {
      findings.push_back(service + " was pinged again while it was registered");
    }
  }
}

}  // namespace spacekeep::sim
