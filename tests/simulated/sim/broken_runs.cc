#include "tests/simulated/sim/broken_runs.h"

#include <stdexcept>
#include <utility>

#include "sim/invariants/log_formats.h"

namespace spacekeep::sim {
namespace {

PlannedService declared(const std::string& id, std::uint64_t bytes, CallBehaviour call) {
  PlannedService service;
  service.id = id;
  service.declared = true;
  service.behaviour = ownsBytes("/", bytes);
  service.behaviour.purge = {call};
  return service;
}

}  // namespace

PurgeRun soundRun() {
  PurgeScenario scenario;
  scenario.volumes = {{"/", 1'000'000, 500}};
  CallBehaviour later;
  later.delay_ns = 100'000'000;
  CallBehaviour failing;
  failing.answer = Answer::kFailsDuringCall;
  failing.delay_ns = 200'000'000;
  CallBehaviour silent;
  silent.answer = Answer::kNever;
  scenario.services = {declared("generous", 3'000, later), declared("poor", 10, later),
                       declared("broken", 0, failing), declared("silent", 0, silent),
                       declared("keeper", 9'000, {})};
  scenario.services.back().purges = false;
  PlannedPurge purge;
  purge.info = {{"SPACEKEEP_VOLUME", "/"},
                {"SPACEKEEP_AMOUNT", 10'000},
                {"SPACEKEEP_TOKEN", "the purge"},
                {"SPACEKEEP_URGENCY", 2}};
  scenario.purges = {purge};
  return playPurgeScenario(std::move(scenario), {});
}

std::size_t lineAt(const PurgeRun& run, std::string_view format, std::size_t nth,
                   const std::function<bool(const LogLine&)>& which) {
  for (std::size_t at = 0; at < run.events.size(); ++at) {
    const auto* one = std::get_if<LogLine>(&run.events[at].body);
    if (one == nullptr || one->format != format || !which(*one)) continue;
    if (nth-- == 0) return at;
  }
  throw std::out_of_range("no such line: " + std::string(format));
}

LogLine& line(PurgeRun& run, std::size_t at) { return std::get<LogLine>(run.events.at(at).body); }

void drop(PurgeRun& run, std::size_t at) {
  run.events.erase(run.events.begin() + static_cast<std::ptrdiff_t>(at));
}

void insertAfter(PurgeRun& run, std::size_t at, EventBody body) {
  Event event = run.events.at(at);
  event.body = std::move(body);
  run.events.insert(run.events.begin() + static_cast<std::ptrdiff_t>(at) + 1, std::move(event));
}

void repeat(PurgeRun& run, std::size_t at) { insertAfter(run, at, run.events.at(at).body); }

void delayFrom(PurgeRun& run, std::size_t at, std::uint64_t by_ns) {
  for (; at < run.events.size(); ++at) run.events[at].at_ns += by_ns;
}

void setInOutcome(PurgeRun& run, std::string_view key, Value value) {
  LogLine& result = line(run, lineAt(run, formats::kResult));
  Dictionary outcome = formats::dictionaryField(result, 1);
  outcome.set(key, std::move(value));
  result.fields.at(1) = Value(std::move(outcome));
}

}  // namespace spacekeep::sim
