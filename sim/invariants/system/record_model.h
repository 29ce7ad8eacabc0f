// Thread safety: none; belongs to one judging thread.
//
// The record of recent answers, worked out anew from the answers, the clock and the free space that
// the trace shows. Written apart from the daemon's own, so that the two can be compared.
#pragma once

#include <cstdint>
#include <map>
#include <string>

#include "support/values/value.h"

namespace spacekeep::sim {

class RecordModel {
 public:
  static constexpr std::int64_t kAgeLimitNs = 120'000'000'000;
  static constexpr std::uint64_t kThresholdBytes = 5 * 1024 * 1024;

  struct Answer {
    Value amount = 0;
    std::int64_t at_ns = 0;  ///< wall clock
  };
  struct Volume {
    std::map<std::string, Answer> services;
    std::uint64_t free = 0;
    std::int64_t at_ns = 0;
  };
  enum class Verdict { kUsable, kInvalid, kChanged };
  using FreeSpace = std::map<std::string, std::uint64_t>;

  void clear() { volumes_.clear(); }
  [[nodiscard]] bool empty() const { return volumes_.empty(); }
  void put(const std::string& volume, Volume entry) { volumes_[volume] = std::move(entry); }
  void answer(const std::string& volume, const std::string& service, Value amount,
              std::uint64_t free, std::int64_t now_ns);
  /// Drops volumes of which nothing is known any more, and answers that are too old.
  Verdict validate(std::int64_t now_ns, const FreeSpace& free);
  [[nodiscard]] Dictionary amountsOf(const std::string& volume) const;
  /// Amounts by volume and service.
  [[nodiscard]] Dictionary text() const;

 private:
  std::map<std::string, Volume> volumes_;
};

}  // namespace spacekeep::sim
