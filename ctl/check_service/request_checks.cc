#include <fmt/core.h>

#include <algorithm>
#include <climits>
#include <cmath>
#include <cstddef>
#include <utility>

#include "ctl/check_service/checks.h"
#include "ctl/check_service/patience.h"
#include "registry/service_protocol.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kQuery = "servicePurgeable";

struct OddRequest {
  std::string what;
  int urgency = kHighestUrgency;
  Dictionary info;
};

Dictionary with(Dictionary info, std::string_view key, Value value) {
  info.set(key, std::move(value));
  return info;
}

Value nested(int levels) {
  Value value(1);
  for (int i = 0; i < levels; ++i) value = Value(Dictionary{{"within", std::move(value)}});
  return value;
}

Dictionary manyKeys() {
  Dictionary info;
  for (int i = 0; i < 1000; ++i) info.set(fmt::format("KEY_{:04}", i), i);
  return info;
}

/// Queries only, so that nothing is lost however a service takes them.
std::vector<OddRequest> oddRequests(const std::string& volume) {
  const Dictionary about{{"SPACEKEEP_VOLUME", volume}};
  std::vector<OddRequest> requests{
      {"an empty dictionary", kHighestUrgency, {}},
      {"a volume that is a number", kHighestUrgency, {{"SPACEKEEP_VOLUME", 7}}},
      {"a volume with an empty name", kHighestUrgency, {{"SPACEKEEP_VOLUME", ""}}},
      {"a volume with a name of 64 KiB",
       kHighestUrgency,
       {{"SPACEKEEP_VOLUME", std::string(65536, 'x')}}},
      {"an amount below 0", kHighestUrgency, with(about, "SPACEKEEP_AMOUNT", -1)},
      {"an amount that is no number (NaN)", kHighestUrgency,
       with(about, "SPACEKEEP_AMOUNT", std::nan(""))},
      {"an amount that is a text", kHighestUrgency, with(about, "SPACEKEEP_AMOUNT", "lots")},
      {"an amount that is a dictionary", kHighestUrgency,
       with(about, "SPACEKEEP_AMOUNT", Dictionary())},
      {"dictionaries in dictionaries, 29 deep", kHighestUrgency, with(about, "KEY", nested(29))},
      {"a thousand unknown keys", kHighestUrgency, manyKeys()}};
  for (const int urgency : {0, -1, 5, INT_MIN, INT_MAX}) {
    requests.push_back({fmt::format("the urgency {}", urgency), urgency, about});
  }
  return requests;
}

/// Calls that are not in the interface: an error is the right answer, and none does no harm.
std::vector<std::pair<std::string, ServiceLine::CallNumber>> strangeCalls(ServiceLine& line) {
  using Kind = ipc::ArgumentKind;
  return {{"a member that is not in the interface",
           line.callAs({.name = "serviceFrobnicate", .in = {}, .out = {}}, {})},
          {"servicePurgeable with a text in place of its arguments",
           line.callAs({.name = kQuery, .in = {{"text", Kind::kString}}, .out = {}},
                       {std::string("all")})}};
}

/// What the service's end has to do with it, empty while it is there.
std::string endOf(Bench& bench) {
  if (bench.subject.reachable()) return "";
  // The process may need a moment to be gone after its socket is.
  within(200 * kMillisecondNs, [&] { return bench.subject.processEnd().has_value(); });
  if (const auto end = bench.subject.processEnd()) return "its process " + *end;
  return "it closed the connection";
}

constexpr const char* kOddAdvice =
    " Take what is missing or of another type as absent, and answer all the same, if need be with "
    "an error.";

}  // namespace

Finding checkOtherMembers(Bench& bench) {
  auto& subject = bench.subject;
  ServiceLine& line = subject.line();
  const std::pair<const char*, ServiceLine::CallNumber> calls[] = {
      {"serviceNotify", line.call("serviceNotify", {Dictionary{{"com.quorvel.check", true}}})},
      {"serviceCallback", line.call("serviceCallback", {Dictionary{}})},
      {"serviceCancelPurge", line.call("serviceCancelPurge", {})}};
  for (const auto& [member, call] : calls) {
    const Asked asked = subject.answerTo(call);
    if (asked.answer) continue;
    return failed(
        fmt::format("{} {}. Every member of the interface is to be answered once, also "
                    "when there is nothing to do for it.",
                    member, asked.problem));
  }
  return fine();
}

Finding checkBackToBack(Bench& bench) {
  auto& subject = bench.subject;
  if (subject.ledger().silent_members.contains(kQuery)) {
    return notApplicable("servicePurgeable was not answered when it came alone.");
  }
  constexpr std::size_t kTogether = 8;
  std::vector<ServiceLine::CallNumber> calls;
  for (std::size_t i = 0; i < kTogether; ++i) {
    const int urgency = static_cast<int>(i % kHighestUrgency) + 1;
    calls.push_back(subject.line().call(kQuery, {urgency, requestFor(bench, 0)}));
  }
  const auto unanswered = std::count_if(calls.begin(), calls.end(), [&](auto call) {
    return !subject.answerTo(call).answer.has_value();
  });
  if (unanswered == 0) return fine(fmt::format("{} at once", kTogether));
  return failed(fmt::format(
      "Of {} queries that came one right after the other, {} got no answer. Keep what comes while "
      "another request is worked on: the daemon serves many clients, and asks for each of them.",
      kTogether, unanswered));
}

Finding checkOddRequests(Bench& bench) {
  auto& subject = bench.subject;
  if (subject.ledger().silent_members.contains(kQuery)) {
    return notApplicable("servicePurgeable was not answered when it made sense.");
  }
  for (const auto& [what, urgency, info] : oddRequests(bench.space.volume())) {
    const auto call = subject.line().call(kQuery, {urgency, info});
    const bool settled = subject.line().waitFor(call, subject.patienceNs()).settled();
    if (const auto end = endOf(bench); !end.empty()) {
      return failed(fmt::format("When it was sent {}, {}.{}", what, end, kOddAdvice));
    }
    if (!settled) {
      return failed(fmt::format("A query with {} was not answered.{}", what, kOddAdvice));
    }
  }
  for (const auto& [what, call] : strangeCalls(subject.line())) {
    static_cast<void>(subject.line().waitFor(call, kSecondNs));
    if (const auto end = endOf(bench); !end.empty()) {
      return failed(fmt::format("When it was sent {}, {}.{}", what, end, kOddAdvice));
    }
  }
  return fine();
}

}  // namespace spacekeep::ctl
