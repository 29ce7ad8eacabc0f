#include <fmt/core.h>

#include <algorithm>

#include "ctl/check_service/checks.h"
#include "ctl/check_service/patience.h"
#include "ctl/size_text.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kNoSuchVolume = "/spacekeep-check/no-such-volume";

std::string refersToAnswers(const Asked& asked) {
  return "servicePurgeable " + asked.problem + ".";
}

/// Empty when nothing is gone.
std::string lossOf(const Bench& bench, const SpaceChange& change) {
  if (change.vanished && !change.vanished->paths.empty()) {
    return namesOf(change.vanished->paths) + " vanished";
  }
  const std::uint64_t gained = SpaceMeter::freedBy(change);
  if (change.vanished || gained <= bench.space.slackFor(0)) return "";
  return "the volume gained " + printSize(gained);
}

/// Asks at every urgency; the last answer that did not come, if there was one.
Asked askAtEveryUrgency(Bench& bench) {
  std::array<std::uint64_t, kHighestUrgency> offered{};
  Asked asked;
  for (int urgency = 1; urgency <= kHighestUrgency; ++urgency) {
    asked = query(bench, urgency);
    if (!asked.answer) return asked;
    offered[static_cast<std::size_t>(urgency - 1)] = amountIn(asked);
  }
  bench.offered = offered;
  return asked;
}

}  // namespace

Finding checkPing(Bench& bench) {
  auto& subject = bench.subject;
  const Asked asked = subject.answerTo(subject.line().call("servicePing", {}));
  if (asked.answer) {
    return fine(fmt::format("after {:.1f} ms", static_cast<double>(asked.elapsed_ns) / 1e6));
  }
  return failed("servicePing " + asked.problem +
                ". The daemon pings a service that checks in and waits for the answer without a "
                "limit; until it comes, no other service can check in and no request is served. "
                "Answer it at once, also while a purge runs.");
}

Finding checkQueryFreesNothing(Bench& bench) {
  const SpaceReading before = bench.space.read();
  const Asked asked = askAtEveryUrgency(bench);
  if (!asked.answer) return notApplicable(refersToAnswers(asked));
  const std::string loss = lossOf(bench, bench.space.since(before, 0));
  if (loss.empty()) {
    return fine("it could free " + printSize(bench.offered->back()) + " at urgency 4");
  }
  return failed(fmt::format(
      "While it was only asked what it could free, {}. servicePurgeable must count and change "
      "nothing: the daemon asks it often, and nobody needs space then.",
      loss));
}

Finding checkQueryAmounts(Bench& bench) {
  if (!bench.offered) return notApplicable("servicePurgeable was not answered.");
  const std::uint64_t used = bench.space.read().used_bytes;
  const std::uint64_t most = *std::max_element(bench.offered->begin(), bench.offered->end());
  if (most <= used + bench.space.slackFor(used)) return fine();
  return failed(
      fmt::format("It says that it could free {}, and all files on {} together occupy {}. Count "
                  "what would come "
                  "back on this volume only: allocated blocks, each file once.",
                  exactSize(most), bench.space.volume(), exactSize(used)));
}

Finding checkQueryUrgencies(Bench& bench) {
  if (!bench.offered) return notApplicable("servicePurgeable was not answered.");
  const auto& offered = *bench.offered;
  for (std::size_t i = 1; i < offered.size(); ++i) {
    if (offered[i] + bench.space.slackFor(offered[i - 1]) >= offered[i - 1]) continue;
    return failed(fmt::format(
        "It offers {} at urgency {}, and only {} at urgency {}. A higher urgency may take all that "
        "a lower one may and more.",
        exactSize(offered[i - 1]), i, exactSize(offered[i]), i + 1));
  }
  return fine(fmt::format("{}, {}, {}, {}", printSize(offered[0]), printSize(offered[1]),
                          printSize(offered[2]), printSize(offered[3])));
}

Finding checkUnknownVolume(Bench& bench) {
  const Asked asked =
      bench.subject.ask("servicePurgeable", kHighestUrgency,
                        Dictionary{{"SPACEKEEP_VOLUME", kNoSuchVolume}}, 10 * kSecondNs);
  if (!asked.answer) return notApplicable(refersToAnswers(asked));
  if (amountIn(asked) == 0) return fine();
  return failed(fmt::format(
      "Asked about {}, a volume that does not exist, it offers {}. Look at \"SPACEKEEP_VOLUME\" "
      "and "
      "count only what lies on that volume: the daemon asks about each volume of the device, and "
      "would count the same data once for each of them.",
      kNoSuchVolume, exactSize(amountIn(asked))));
}

Finding checkPurgeOfUnknownVolume(Bench& bench) {
  Dictionary info = requestFor(bench, bench.offered ? bench.offered->back() : 0);
  info.set("SPACEKEEP_VOLUME", kNoSuchVolume);
  const SpaceReading before = bench.space.read();
  const Asked asked =
      bench.subject.ask("servicePurge", kHighestUrgency, info, purgeWaitNs(kHighestUrgency));
  if (!asked.answer) return notApplicable("servicePurge " + asked.problem + ".");
  const SpaceChange change = bench.space.since(before, amountIn(asked));
  const std::string loss = lossOf(bench, change);
  if (loss.empty()) return fine();
  return failed(
      fmt::format("Asked to free space on {}, a volume that does not exist, {} on {}. Look at "
                  "\"SPACEKEEP_VOLUME\": data on another volume is given up for nothing.",
                  kNoSuchVolume, loss, bench.space.volume()));
}

}  // namespace spacekeep::ctl
