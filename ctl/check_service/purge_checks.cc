#include <fmt/core.h>

#include <algorithm>
#include <optional>

#include "ctl/check_service/checks.h"
#include "ctl/check_service/patience.h"
#include "ctl/size_text.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kNothingLeft =
    "The service has nothing to give at urgency 4. Fill its cache and check again.";
constexpr std::uint64_t kCancelNs = 2 * kSecondNs;
constexpr std::uint64_t kTooQuickNs = kSecondNs;
constexpr std::uint64_t kLongestWaitNs = 60 * kSecondNs;
constexpr std::uint64_t kQuietNs = kSecondNs;
constexpr std::uint64_t kHeadStartNs = 50 * kMillisecondNs;
constexpr std::uint64_t kPeriodicWaitNs = 15 * kSecondNs;
constexpr int kPeriodicUrgency = 3;

Finding refersTo(const char* member, const Asked& asked) {
  return notApplicable(fmt::format("{} {}.", member, asked.problem));
}

double milliseconds(std::uint64_t duration_ns) { return static_cast<double>(duration_ns) / 1e6; }

/// The share and the size of one item, beyond which a purge has taken too much.
Finding limitOf(const Bench& bench, const SpaceReading& before, std::uint64_t share,
                std::uint64_t freed) {
  const std::uint64_t file = before.files ? largestOf(*before.files) : share;
  const std::uint64_t item = std::max(file, bench.item_bytes);
  if (freed <= share + item + bench.space.slackFor(0)) {
    return fine(fmt::format("{} for {}", printSize(freed), printSize(share)));
  }
  const std::string allowance =
      item > file    ? "its largest item has " + exactSize(item)
      : before.files ? "its largest file has " + exactSize(item)
                     : "twice the amount is taken for too much, since the size of its items is not "
                       "known without --data";
  return failed(fmt::format(
      "Asked for {}, it gave up {} ({}). Stop at the first item with which the amount is reached: "
      "what goes beyond is lost for nothing.",
      exactSize(share), exactSize(freed), allowance));
}

}  // namespace

Finding checkPurgeOfNothing(Bench& bench) {
  struct Case {
    const char* what;
    std::optional<Value> amount;
  };
  // What is not a number counts as absent, and absent as 0.
  const Case cases[] = {{"0 bytes", Value(0)},
                        {"no amount at all", std::nullopt},
                        {"the amount \"all\", which is no number,", Value("all")}};
  for (const auto& [what, amount] : cases) {
    Dictionary info = requestFor(bench, 0);
    info.remove("SPACEKEEP_AMOUNT");
    if (amount) info.set("SPACEKEEP_AMOUNT", *amount);
    const Purged none = purgeWith(bench, info, what, purgeWaitNs(kHighestUrgency));
    if (!none.asked.answer) return refersTo("servicePurge", none.asked);
    if (none.freed_bytes <= (none.change.vanished ? 0 : bench.space.slackFor(0))) continue;
    return failed(fmt::format(
        "Asked for {} it gave up {}. Compare what was freed with \"SPACEKEEP_AMOUNT\" before the "
        "first item goes, not after it.",
        what, exactSize(none.freed_bytes)));
  }
  return fine();
}

Finding checkPurgeOfShare(Bench& bench) {
  const Asked before = query(bench, kHighestUrgency);
  if (!before.answer) return refersTo("servicePurgeable", before);
  const std::uint64_t offered = amountIn(before);
  if (offered == 0) return notApplicable(kNothingLeft);
  const std::uint64_t share = std::max<std::uint64_t>(offered / 4, 1);
  const SpaceReading reading = bench.space.read();
  const Purged purged = purge(bench, share, purgeWaitNs(kHighestUrgency));
  if (!purged.asked.answer) return refersTo("servicePurge", purged.asked);
  bench.share_limit = limitOf(bench, reading, share, purged.freed_bytes);
  if (purged.freed_bytes + bench.space.slackFor(share) >= share) {
    return fine(fmt::format("{} of {}", printSize(purged.freed_bytes), printSize(offered)));
  }
  return failed(fmt::format(
      "It offered {} at urgency 4, was asked for {} of it, and gave up {}. Who gives less than its "
      "share is not asked again at that urgency, so offer what can be had and give it.",
      exactSize(offered), exactSize(share), exactSize(purged.freed_bytes)));
}

Finding checkPurgeLimit(Bench& bench) {
  if (bench.share_limit) return *bench.share_limit;
  return notApplicable("The purge for a share told nothing (see purge-share).");
}

/// A purge that a service does not end is waited for as long as it frees something, because what it
/// frees must not be taken for the work of a later request.
void awaitQuiet(const Bench& bench, ServiceLine::CallNumber purge) {
  std::uint64_t free_bytes = bench.space.freeBytes();
  std::uint64_t quiet_since = rt::ticks();
  within(kLongestWaitNs, [&] {
    const std::uint64_t now = bench.space.freeBytes();
    if (now != free_bytes) quiet_since = rt::ticks();
    free_bytes = now;
    return bench.subject.line().waitFor(purge, 0).settled() ||
           elapsedNs(quiet_since, rt::ticks()) > kQuietNs;
  });
}

Finding checkCancel(Bench& bench) {
  auto& subject = bench.subject;
  const std::uint64_t offered = amountIn(query(bench, kHighestUrgency));
  if (offered == 0) return notApplicable(kNothingLeft);
  if (subject.ledger().silent_members.contains("servicePurge")) {
    return notApplicable("servicePurge was not answered before and is not asked again.");
  }
  const SpaceReading before = bench.space.read();
  const auto running =
      subject.line().call("servicePurge", {kHighestUrgency, requestFor(bench, offered)});
  // In the middle, where that can be seen; a purge that is over meanwhile is told below.
  within(kHeadStartNs, [&] { return bench.space.freeBytes() > before.free_bytes; });
  const std::uint64_t cancelled_at = rt::ticks();
  const auto cancelling = subject.line().call("serviceCancelPurge", {});
  awaitQuiet(bench, running);
  const Asked purged = subject.answerTo(running);
  const Asked cancelled = subject.answerTo(cancelling);
  const auto answered_at = subject.line().waitFor(running, 0).answered_ticks;
  const std::uint64_t took_ns = elapsedNs(cancelled_at, answered_at);
  const std::string advice =
      " Look between items whether the purge is still wanted, and answer what was freed so far.";
  if (!cancelled.answer) return failed("serviceCancelPurge " + cancelled.problem + ".");
  const bool refused = !purged.answer && !purged.silent && subject.reachable();
  if (refused) return refersTo("servicePurge", purged);
  if (!purged.answer) return failed("The purge " + purged.problem + " after the cancel." + advice);
  const Purged booked = bookPurge(bench, before, purged, "a purge that was cancelled");
  const bool all = booked.freed_bytes + bench.space.slackFor(offered) >= offered;
  const std::string took = fmt::format("{:.0f} ms", milliseconds(took_ns));
  if (took_ns > kCancelNs || (all && took_ns > kTooQuickNs)) {
    return failed(
        fmt::format("The purge went on for {} after serviceCancelPurge and gave up {} of {}.{}",
                    took, printSize(booked.freed_bytes), printSize(offered), advice));
  }
  if (all) {
    return notApplicable(
        fmt::format("The purge of {} was over after {}, too soon for a cancel to show. Fill the "
                    "cache with more items and check again.",
                    printSize(offered), took));
  }
  return fine(fmt::format("after {}, with {} of {} given up", took, printSize(booked.freed_bytes),
                          printSize(offered)));
}

Finding checkPeriodic(Bench& bench) {
  const SpaceReading before = bench.space.read();
  Asked asked =
      bench.subject.ask("servicePeriodic", kPeriodicUrgency,
                        Dictionary{{"SPACEKEEP_VOLUME", bench.space.volume()}}, kPeriodicWaitNs);
  if (!asked.answer) return refersTo("servicePeriodic", asked);
  const Purged booked = bookPurge(bench, before, std::move(asked), "servicePeriodic");
  return fine("freed " + printSize(booked.freed_bytes));
}

Finding checkPurgeOfEverything(Bench& bench) {
  const Asked before = query(bench, kHighestUrgency);
  if (!before.answer) return refersTo("servicePurgeable", before);
  const std::uint64_t offered = amountIn(before);
  if (offered == 0) return notApplicable(kNothingLeft);
  constexpr std::uint64_t kMore = std::uint64_t{1} << 40;
  const Purged purged = purge(bench, offered + kMore, kNoLimitNs);
  if (!purged.asked.answer) return refersTo("servicePurge", purged.asked);
  const std::uint64_t kept = bench.held ? bench.held->occupiedBytes() : 0;
  const std::uint64_t expected = offered - std::min(offered, kept + bench.space.slackFor(offered));
  if (purged.freed_bytes >= expected) {
    return fine(fmt::format("{} of {}", printSize(purged.freed_bytes), printSize(offered)));
  }
  return failed(fmt::format(
      "It offered {} at urgency 4, was asked for more than it has, and gave up {}. Give all that "
      "can be given, and answer how much that was.",
      exactSize(offered), exactSize(purged.freed_bytes)));
}

Finding checkInUse(Bench& bench) {
  if (!bench.held) {
    return notApplicable(
        "Not told which files to use meanwhile. Name one, or the directory of the cache, with "
        "--in-use.");
  }
  const auto& losses = bench.held->losses();
  if (losses.empty() && bench.held->empty()) {
    return notApplicable("There was no file to use below " + bench.in_use + ".");
  }
  if (losses.empty()) return fine(fmt::format("{} kept", bench.held->size()));
  return failed(fmt::format(
      "It removed {}. The space of a file that is in use comes back only when its last user has "
      "gone, and that user may need it again.",
      firstOf(losses)));
}

}  // namespace spacekeep::ctl
