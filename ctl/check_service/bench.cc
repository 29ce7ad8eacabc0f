#include "ctl/check_service/bench.h"

#include <fmt/core.h>

#include <algorithm>
#include <utility>

#include "ctl/check_service/patience.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::uint64_t kQueryWaitNs = 10 * kSecondNs;

void compare(Bench& bench, const std::string& what, std::uint64_t reported,
             const SpaceChange& change) {
  const auto gained = static_cast<std::uint64_t>(std::max<std::int64_t>(change.gained_bytes, 0));
  const std::uint64_t slack = bench.space.slackFor(std::max(reported, gained));
  const std::uint64_t difference = reported > gained ? reported - gained : gained - reported;
  Ledger& ledger = bench.subject.ledger();
  ++ledger.amounts_compared;
  if (difference <= slack) return;
  ledger.dishonest.push_back(
      fmt::format("After {} it said that it had freed {}, and the volume gained {}.", what,
                  printSize(reported), printSignedSize(change.gained_bytes)));
}

}  // namespace

Dictionary requestFor(const Bench& bench, std::uint64_t amount_bytes) {
  return {{"SPACEKEEP_VOLUME", bench.space.volume()},
          {"SPACEKEEP_AMOUNT", amount_bytes},
          {"SPACEKEEP_URGENCY", kHighestUrgency},
          {"SPACEKEEP_FREESPACE_BEGIN", bench.space.freeBytes()}};
}

Asked query(Bench& bench, int urgency) {
  const Dictionary info{{"SPACEKEEP_VOLUME", bench.space.volume()}, {"SPACEKEEP_URGENCY", urgency}};
  return bench.subject.ask("servicePurgeable", urgency, info, kQueryWaitNs);
}

std::uint64_t amountIn(const Asked& asked) {
  return asked.answer ? unsignedAt(*asked.answer, "SPACEKEEP_AMOUNT").value_or(0) : 0;
}

Purged purge(Bench& bench, std::uint64_t amount_bytes, std::uint64_t limit_ns) {
  return purgeWith(bench, requestFor(bench, amount_bytes), printSize(amount_bytes), limit_ns);
}

Purged purgeWith(Bench& bench, const Dictionary& info, const std::string& what,
                 std::uint64_t limit_ns) {
  const SpaceReading before = bench.space.read();
  Asked asked = bench.subject.ask("servicePurge", kHighestUrgency, info, limit_ns);
  return bookPurge(bench, before, std::move(asked), "being asked for " + what);
}

Purged bookPurge(Bench& bench, const SpaceReading& before, Asked asked, const std::string& what) {
  if (bench.held) bench.held->releaseRemoved();
  Purged purged{.asked = std::move(asked), .change = {}};
  purged.reported_bytes = amountIn(purged.asked);
  purged.change = bench.space.since(before, purged.reported_bytes);
  purged.freed_bytes = SpaceMeter::freedBy(purged.change);
  const bool says_amount =
      purged.asked.answer && Ledger::problemOfAmount(*purged.asked.answer).empty();
  if (says_amount) compare(bench, what, purged.reported_bytes, purged.change);
  return purged;
}

std::uint64_t purgeWaitNs(int urgency) {
  return 2 * static_cast<std::uint64_t>(urgency) * kSecondNs;
}

std::string exactSize(std::uint64_t bytes) {
  return bytes < 1024 ? printSize(bytes)
                      : fmt::format("{} ({} bytes)", printSize(bytes), printCount(bytes));
}

}  // namespace spacekeep::ctl
