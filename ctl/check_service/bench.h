// Thread safety: for one thread.
//
// What the checks share: the service, the volume, and what earlier checks have learnt.
#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>

#include "ctl/check_service/finding.h"
#include "ctl/check_service/held_files.h"
#include "ctl/check_service/space_meter.h"
#include "ctl/check_service/subject.h"

namespace spacekeep::ctl {

inline constexpr int kHighestUrgency = 4;

struct Bench {
  Subject& subject;
  SpaceMeter& space;
  std::string in_use;            ///< a file or directory to use during purges; may be empty
  std::uint64_t item_bytes = 0;  ///< the largest item, where items are more than single files
  std::optional<HeldFiles> held;
  /// What the service said it could free, by urgency 1 to 4. None until it was asked.
  std::optional<std::array<std::uint64_t, kHighestUrgency>> offered;
  /// Of the purge for a share.
  std::optional<Finding> share_limit;
};

/// A request about the volume, as the daemon sends it.
[[nodiscard]] Dictionary requestFor(const Bench& bench, std::uint64_t amount_bytes);

[[nodiscard]] Asked query(Bench& bench, int urgency);
/// The bytes of an answer; 0 when there is none, or it is no number.
[[nodiscard]] std::uint64_t amountIn(const Asked& asked);

struct Purged {
  Asked asked;
  std::uint64_t reported_bytes = 0;
  std::uint64_t freed_bytes = 0;  ///< what was really given up
  SpaceChange change;
};

/// servicePurge, with what it did to the volume. Compares what was said with what was gained. The
/// ledger hears of answers that take longer than `limit_ns`.
[[nodiscard]] Purged purge(Bench& bench, std::uint64_t amount_bytes, std::uint64_t limit_ns);
/// The same with a request made by hand; `what` says what it asks for.
[[nodiscard]] Purged purgeWith(Bench& bench, const Dictionary& info, const std::string& what,
                               std::uint64_t limit_ns);
/// The end of a purge that was asked for otherwise.
[[nodiscard]] Purged bookPurge(Bench& bench, const SpaceReading& before, Asked asked,
                               const std::string& what);

inline constexpr std::uint64_t kNoLimitNs = UINT64_MAX;
/// How long the daemon waits for a purge at that urgency, unless its client says otherwise.
[[nodiscard]] std::uint64_t purgeWaitNs(int urgency);

/// "1.5 MiB (1572864 bytes)" for what is to be compared to the byte.
[[nodiscard]] std::string exactSize(std::uint64_t bytes);

}  // namespace spacekeep::ctl
