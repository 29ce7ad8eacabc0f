#include "sim/invariants/purge_story.h"

#include <algorithm>
#include <string_view>

namespace spacekeep::sim {
namespace {

const std::string* volumeOf(const Operation& operation) {
  return stringAt(operation.request, "SPACEKEEP_VOLUME");
}

}  // namespace

std::size_t PurgeStory::operationOfCall(std::uint64_t number) const {
  const auto found = std::find_if(calls.begin(), calls.end(),
                                  [&](const PurgeCall& call) { return call.number == number; });
  return found == calls.end() ? kNowhere : found->operation;
}

std::vector<std::uint64_t> PurgeStory::freeBetween(const std::string& volume, std::size_t first,
                                                   std::size_t last) const {
  std::vector<std::uint64_t> values = {0};
  for (std::size_t at = 0; at <= last && at < run.events.size(); ++at) {
    const auto* space = std::get_if<FreeSpaceIs>(&run.events[at].body);
    if (space == nullptr || space->volume != volume) continue;
    if (at <= first) {
      values.front() = space->free;
    } else {
      values.push_back(space->free);
    }
  }
  return values;
}

bool PurgeStory::hadFreed(const Operation& operation, std::uint64_t bytes, std::size_t first,
                          std::size_t last) const {
  const std::string* volume = volumeOf(operation);
  const std::uint64_t begin = operation.free_at_begin;
  const auto values = freeBetween(volume == nullptr ? "" : *volume, first, last);
  return std::any_of(values.begin(), values.end(), [&](std::uint64_t free) {
    return bytes == (free > begin ? free - begin : 0);
  });
}

bool PurgeStory::hadReached(const Operation& operation, std::size_t first, std::size_t last) const {
  const std::string* volume = volumeOf(operation);
  const std::uint64_t begin = operation.free_at_begin;
  const auto values = freeBetween(volume == nullptr ? "" : *volume, first, last);
  return std::any_of(values.begin(), values.end(), [&](std::uint64_t free) {
    return (free > begin ? free - begin : 0) >= operation.needed;
  });
}

int PurgeStory::inFlightBefore(std::size_t operation, const std::string& service,
                               std::size_t at) const {
  int count = 0;
  for (const ShareTask& task : tasks) {
    if (task.operation == operation && task.service == service && task.added &&
        task.adding_at < at) {
      ++count;
    }
  }
  for (const Reply& reply : replies) {
    if (reply.operation == operation && reply.service == service && reply.removing_at < at) {
      --count;
    }
  }
  for (const Failure& failure : failures) {
    if (failure.operation == operation && failure.service == service && failure.removing_at < at) {
      --count;
    }
  }
  return count;
}

std::map<std::size_t, int> PurgeStory::flightChanges(std::size_t operation, bool asked_only) const {
  std::map<std::size_t, int> changes;
  for (const ShareTask& task : tasks) {
    const bool counts = task.operation == operation && task.added && task.share &&
                        (!asked_only || task.share->donation > 0);
    if (counts) ++changes[task.adding_at];
  }
  for (const Reply& reply : replies) {
    if (reply.operation == operation) --changes[reply.removing_at];
  }
  for (const Failure& failure : failures) {
    if (failure.operation == operation) --changes[failure.removing_at];
  }
  return changes;
}

bool PurgeStory::wasIdle(std::size_t operation, std::size_t first, std::size_t last,
                         bool asked_only) const {
  int count = 0;
  bool idle = true;
  for (const auto& [at, change] : flightChanges(operation, asked_only)) {
    if (at > last) break;
    if (at > first && idle) return true;
    count += change;
    idle = count <= 0;
  }
  return idle;
}

bool PurgeStory::staysIdle(std::size_t operation, std::size_t first, std::size_t last) const {
  int count = 0;
  for (const auto& [at, change] : flightChanges(operation, false)) {
    if (at > last) break;
    if (at > first && count > 0) return false;
    count += change;
  }
  return count <= 0;
}

std::pair<int, int> PurgeStory::inFlightBetween(std::size_t operation, std::size_t first,
                                                std::size_t last) const {
  int count = 0;
  std::optional<std::pair<int, int>> range;
  for (const auto& [at, change] : flightChanges(operation, false)) {
    if (at > last) break;
    if (at > first && !range) range = {count, count};
    count += change;
    if (range) range = {std::min(range->first, count), std::max(range->second, count)};
  }
  return range.value_or(std::pair{count, count});
}

bool PurgeStory::mayFinishEarly(const Operation& operation) const {
  if (operation.request.contains("SPACEKEEP_FINISH_EARLY")) {
    return truthAt(operation.request, "SPACEKEEP_FINISH_EARLY");
  }
  return run.may_finish_early_by_default;
}

// Services get the request back, with what the purge has written into its outcome by then.
bool isRequestOf(const Operation& operation, const Dictionary& request) {
  static const std::set<std::string_view> kWritten = {
      "SPACEKEEP_AMOUNT", "SPACEKEEP_AMOUNT_REPORTED", "SPACEKEEP_ELAPSED_TIME",
      "SPACEKEEP_FREESPACE_BEGIN", "SPACEKEEP_FREESPACE_END"};
  for (const auto& [key, value] : operation.request) {
    const Value* other = request.find(key);
    if (!kWritten.contains(key) && (other == nullptr || *other != value)) return false;
  }
  for (const auto& [key, value] : request) {
    const bool is_written = kWritten.contains(key) || key.ends_with("_OPERATION_INFO");
    if (!is_written && !operation.request.contains(key)) return false;
  }
  return unsignedAt(request, "SPACEKEEP_FREESPACE_BEGIN") == operation.free_at_begin;
}

PurgeView viewOf(const PurgeRun& run) {
  PurgeView view;
  view.events = run.events;
  view.scenario = &run.scenario;
  view.end = run.report.end;
  view.blocked = run.report.blocked;
  for (const PlannedService& service : run.scenario.services) {
    view.service_ids.push_back(service.id);
  }
  view.asked_twice = run.asked_twice;
  return view;
}

// Offers take no time beside that of a disk that keeps a thread busy.
bool PurgeStory::namedAllServices(const Operation& operation) const {
  if (operation.end_at == kNowhere) return false;
  if (!run.cut) return true;
  const auto asking = std::find_if(operation.passes.begin(), operation.passes.end(),
                                   [](const Pass& pass) { return pass.asked_at != kNowhere; });
  if (asking == operation.passes.end()) return true;
  const std::size_t last = run.events.size() - 1;
  return timeAt(last) > timeAt(asking->asked_at) + writingNs(asking->asked_at, last);
}

// One write may be under way at the beginning of the span, and one at its end.
std::uint64_t PurgeStory::writingNs(std::size_t first, std::size_t last) const {
  std::uint64_t writes = 2;
  for (std::size_t at = first; at <= last && at < run.events.size(); ++at) {
    if (std::holds_alternative<DiskWritten>(run.events[at].body)) ++writes;
  }
  return writes * run.disk_write_ns;
}

std::string PurgeStory::name(const Operation& operation) const {
  return "purge of " + std::to_string(operation.needed) + " bytes (" + operation.token + ")";
}

}  // namespace spacekeep::sim
