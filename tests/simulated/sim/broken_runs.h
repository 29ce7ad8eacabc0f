// Thread safety: plain values.
//
// A run in which everything is right, and the means to spoil it in one place.
#pragma once

#include <cstddef>
#include <functional>
#include <string_view>

#include "sim/scenarios/purge_run.h"

namespace spacekeep::sim {

/// One purge that falls short: a service that meets its share, one that falls short, one whose
/// connection fails, one that never answers, and one that does not purge.
[[nodiscard]] PurgeRun soundRun();

/// Position of the nth log line of that format, of those that `which` accepts.
[[nodiscard]] std::size_t lineAt(
    const PurgeRun& run, std::string_view format, std::size_t nth = 0,
    const std::function<bool(const LogLine&)>& which = [](const LogLine&) { return true; });
[[nodiscard]] LogLine& line(PurgeRun& run, std::size_t at);
/// Position of the first event of that kind that `which` accepts.
template <class Body>
[[nodiscard]] std::size_t eventAt(const PurgeRun& run,
                                  const std::function<bool(const Body&)>& which) {
  for (std::size_t at = 0; at < run.events.size(); ++at) {
    const auto* body = std::get_if<Body>(&run.events[at].body);
    if (body != nullptr && which(*body)) return at;
  }
  return run.events.size();
}

void drop(PurgeRun& run, std::size_t at);
void insertAfter(PurgeRun& run, std::size_t at, EventBody body);
void repeat(PurgeRun& run, std::size_t at);
/// Everything from there on happens that much later.
void delayFrom(PurgeRun& run, std::size_t at, std::uint64_t by_ns);
/// Changes one entry of the outcome that the purge logged.
void setInOutcome(PurgeRun& run, std::string_view key, Value value);

}  // namespace spacekeep::sim
