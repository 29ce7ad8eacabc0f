// Thread safety: pure functions over plain values.
//
// The outcome of a purge, from the daemon's dictionary to something a person or a program can read.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "ctl/style.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

struct ServiceAmount {
  std::string id;
  std::uint64_t reported_bytes = 0;  ///< what the service says it gave in its last answer
};

/// What happened at one urgency.
struct UrgencyReport {
  int urgency = 0;
  std::vector<ServiceAmount> services;           ///< those that answered
  std::vector<std::string> unanswered;           ///< those still waited for when the time was up
  std::optional<std::uint64_t> timeout_seconds;  ///< the wait that ran out, none if it did not
};

struct PurgeReport {
  std::string volume;
  std::uint64_t asked_bytes = 0;
  std::uint64_t freed_bytes = 0;     ///< measured on the volume
  std::uint64_t reported_bytes = 0;  ///< the sum of what the services say
  double elapsed_seconds = 0;
  std::uint64_t free_before_bytes = 0;
  std::uint64_t free_after_bytes = 0;
  bool cancelled = false;
  std::optional<std::string> error;  ///< the daemon could not work with the request
  std::vector<UrgencyReport> urgencies;

  [[nodiscard]] bool reached() const { return !error && freed_bytes >= asked_bytes; }
};

/// Whatever is missing in the outcome, or of another kind than expected, reads as absent.
[[nodiscard]] PurgeReport purgeReport(const Dictionary& outcome, std::uint64_t asked_bytes);

/// A table of several lines, each ended by a line break; on a terminal fitted to its width.
[[nodiscard]] std::string tableOf(const PurgeReport& report, const Style& style);

/// One object; the man page of the tool describes its members.
[[nodiscard]] std::string jsonOf(const PurgeReport& report);

}  // namespace spacekeep::ctl
