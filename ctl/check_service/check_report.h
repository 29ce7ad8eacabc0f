// Thread safety: for one thread.
//
// The results, for people as they come, and for programs at the end.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "ctl/check_service/finding.h"
#include "ctl/style.h"

namespace spacekeep::ctl {

struct CheckResult {
  std::string name;
  Finding finding;
};

struct CheckReport {
  std::string service;
  std::string volume;
  std::vector<CheckResult> results;

  [[nodiscard]] std::size_t count(Outcome outcome) const;
};

/// "ping   ok, after 0.3 ms", "cancel   FAILED: ..." with a line end. On a terminal long texts are
/// wrapped; elsewhere a check is one line.
[[nodiscard]] std::string lineOf(const CheckResult& result, const Style& style);
/// "23 checks: 21 ok, 1 failed, 1 not applicable".
[[nodiscard]] std::string summaryOf(const CheckReport& report);
[[nodiscard]] std::string jsonOf(const CheckReport& report);

}  // namespace spacekeep::ctl
