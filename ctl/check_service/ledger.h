// Thread safety: for one thread.
//
// What was asked in the course of all checks, and what was wrong with the answers.
#pragma once

#include <cstddef>
#include <cstdint>
#include <set>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::ctl {

struct Ledger {
  std::size_t requests = 0;
  std::set<std::string> silent_members;  ///< did not answer once, and are not asked any more
  std::vector<std::string> unanswered;   ///< each of these lists: one sentence per case
  std::vector<std::string> late;
  std::vector<std::string> malformed;
  std::vector<std::string> dishonest;
  std::size_t amounts_compared = 0;

  /// What is wrong with "SPACEKEEP_AMOUNT" of an answer, empty when nothing.
  [[nodiscard]] static std::string problemOfAmount(const Dictionary& answer);
};

/// The first of them and how many more there are, since one fault mostly shows many times.
[[nodiscard]] std::string firstOf(const std::vector<std::string>& sentences);

}  // namespace spacekeep::ctl
