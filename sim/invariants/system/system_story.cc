#include "sim/invariants/system/system_story.h"

#include <algorithm>

namespace spacekeep::sim {

bool Call::holds(std::string_view right) const {
  return std::find(rights.begin(), rights.end(), right) != rights.end();
}

std::size_t Call::endedAt() const { return std::min({answeredAt(), refused_at, dropped_at}); }

std::int64_t Life::wallAt(std::size_t at) const {
  std::int64_t wall_ns = 0;
  std::uint64_t began_ns = 0;
  for (std::size_t i = 0; i <= at && i < events.size(); ++i) {
    if (const auto* began = as<LifeBegan>(i)) {
      wall_ns = began->wall_clock_ns;
      began_ns = timeAt(i);
    } else if (const auto* jump = as<ClockJumped>(i)) {
      wall_ns += jump->by_ns;
    }
  }
  return wall_ns + static_cast<std::int64_t>(timeAt(at) - began_ns);
}

std::size_t Life::firstOfMoment(std::size_t at) const {
  while (at > 0 && timeAt(at - 1) == timeAt(at)) --at;
  return at;
}

std::size_t Life::lastOfMoment(std::size_t at) const {
  while (at + 1 < events.size() && timeAt(at + 1) == timeAt(at)) ++at;
  return at;
}

bool Life::registryWaited(std::size_t first, std::size_t last) const {
  return std::any_of(pings.begin(), pings.end(),
                     [&](const PingWait& wait) { return wait.from <= last && wait.to >= first; });
}

// One write may be under way at the beginning of the span, and one at its end.
std::uint64_t Life::writingNs(const SystemPlan& plan, std::size_t first, std::size_t last) const {
  std::uint64_t writes = 2;
  for (std::size_t at = first; at <= last && at < events.size(); ++at) {
    if (as<DiskWritten>(at) != nullptr) ++writes;
  }
  return writes * plan.disk_write_ns;
}

bool SystemStory::isKnownVolume(const std::optional<Dictionary>& info) const {
  const std::string* volume = info ? stringAt(*info, "SPACEKEEP_VOLUME") : nullptr;
  return volume != nullptr && volumes.contains(*volume);
}

std::string nameOf(const Call& call) {
  return call.member + " #" + std::to_string(call.number) + " of " + call.client;
}

bool isQueryMember(std::string_view member) {
  return member == "clientPurgeableSpace" || member == "clientItemizedPurgeableSpace";
}

bool isLowSpacePurge(const Dictionary& request) {
  return request.size() == 4 && truthAt(request, "SPACEKEEP_ASYNC") &&
         unsignedAt(request, "SPACEKEEP_PURGE_TIMEOUT") == 300 &&
         request.contains("SPACEKEEP_VOLUME") && request.contains("SPACEKEEP_AMOUNT");
}

std::int32_t urgencyLimitIn(const Dictionary& request) {
  const Value* limit = request.find("SPACEKEEP_URGENCY");
  if (limit == nullptr) limit = request.find("SPACEKEEP_URGENCY_LIMIT");
  const auto level = limit == nullptr ? std::nullopt : limit->asSigned();
  return level && *level >= 1 && *level <= 4 ? static_cast<std::int32_t>(*level) : 3;
}

}  // namespace spacekeep::sim
