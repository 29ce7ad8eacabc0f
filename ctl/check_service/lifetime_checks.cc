#include <fmt/core.h>

#include "ctl/check_service/checks.h"
#include "ctl/check_service/patience.h"
#include "ctl/check_service/process_gauge.h"
#include "ctl/size_text.h"

namespace spacekeep::ctl {
namespace {

constexpr int kWarmUp = 40;
constexpr int kHalf = 100;
constexpr std::uint64_t kDescriptorsPerHalf = 20;
constexpr std::uint64_t kMemoryPerHalfBytes = 512 * 1024;
/// How long a service may take to fall over an end of the daemon.
constexpr std::uint64_t kAftermathNs = kSecondNs;

/// False when one was not answered.
bool askOften(Bench& bench, int times) {
  for (int i = 0; i < times; ++i) {
    if (!query(bench, i % kHighestUrgency + 1).answer) return false;
  }
  return true;
}

std::uint64_t growth(std::uint64_t before, std::uint64_t after) {
  return after > before ? after - before : 0;
}

/// What grew in both halves, since something that is only filled once grows in the first.
std::string growthOver(const ProcessUse& start, const ProcessUse& middle, const ProcessUse& end) {
  const auto grew = [&](std::uint64_t ProcessUse::*what, std::uint64_t per_half) {
    return growth(start.*what, middle.*what) >= per_half &&
           growth(middle.*what, end.*what) >= per_half;
  };
  if (grew(&ProcessUse::descriptors, kDescriptorsPerHalf)) {
    return fmt::format("{} more open descriptors", end.descriptors - start.descriptors);
  }
  if (grew(&ProcessUse::threads, kDescriptorsPerHalf)) {
    return fmt::format("{} more threads", end.threads - start.threads);
  }
  if (grew(&ProcessUse::memory_bytes, kMemoryPerHalfBytes)) {
    return printSize(end.memory_bytes - start.memory_bytes) + " more memory";
  }
  return "";
}

std::string textOf(const ProcessUse& use) {
  return fmt::format("{} descriptors, {} threads, {}", use.descriptors, use.threads,
                     printSize(use.memory_bytes));
}

}  // namespace

Finding checkUpkeep(Bench& bench) {
  const auto pid = bench.subject.pid();
  if (!pid || !useOf(*pid)) {
    return notApplicable(
        "The service's process is not known or not to be looked at. Let this tool start the "
        "service, with its command after --.");
  }
  if (!askOften(bench, kWarmUp)) return notApplicable("servicePurgeable was not answered.");
  const auto start = useOf(*pid);
  const bool first_half = askOften(bench, kHalf);
  const auto middle = useOf(*pid);
  const bool second_half = askOften(bench, kHalf);
  const auto end = useOf(*pid);
  if (!first_half || !second_half || !start || !middle || !end) {
    return notApplicable("The service did not answer 200 queries in a row.");
  }
  const std::string grown = growthOver(*start, *middle, *end);
  if (grown.empty()) return fine(textOf(*end));
  return failed(fmt::format(
      "After {} queries it has {} than before, and goes on growing. Release what belongs to a "
      "request once it is answered.",
      2 * kHalf, grown));
}

Finding checkDaemonGone(Bench& bench) {
  auto& subject = bench.subject;
  const Dictionary info{{"SPACEKEEP_VOLUME", bench.space.volume()}};
  for (int i = 0; i < 4; ++i) subject.line().call("servicePurgeable", {kHighestUrgency, info});
  subject.goAway();
  within(kAftermathNs, [&] { return subject.processEnd().has_value(); });
  if (const auto end = subject.processEnd(); end && !subject.endedInPeace()) {
    static_cast<void>(subject.comeBack());  // for the checks that follow
    return failed(fmt::format(
        "The daemon went away in the middle of a call, and the process of the service {}. The "
        "daemon is restarted now and then: drop what it asked for, and {}.",
        *end, subject.checkedIn() ? "check in again until it is back" : "wait for its next call"));
  }
  const std::uint64_t back_at = rt::ticks();
  if (const std::string why = subject.comeBack(); !why.empty()) {
    return failed("The daemon went away and came back, and the service did not return: " + why +
                  ". Try again with a pause, until the daemon has answered.");
  }
  const auto took = fmt::format("back after {:.1f} s",
                                static_cast<double>(elapsedNs(back_at, rt::ticks())) / 1e9);
  if (subject.ledger().silent_members.contains("servicePurgeable")) return fine(took);
  const Asked asked =
      subject.answerTo(subject.line().call("servicePurgeable", {kHighestUrgency, info}));
  if (asked.answer) return fine(took);
  return failed("After the daemon had gone and come back, servicePurgeable " + asked.problem +
                ". What a call began must not stand in the way of the calls after it.");
}

}  // namespace spacekeep::ctl
