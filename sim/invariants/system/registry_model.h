// Thread safety: plain values; refers to the story it was made from.
//
// What the registry may hold, and what it surely holds, as far as the trace tells.
#pragma once

#include <set>
#include <string>
#include <vector>

#include "sim/invariants/system/system_story.h"

namespace spacekeep::sim {

class RegistryModel {
 public:
  RegistryModel(const SystemStory& story, const Life& life);

  /// Whether a snapshot taken before `at` can hold the service with that role.
  [[nodiscard]] bool mayPurge(const std::string& service, std::size_t at) const;
  [[nodiscard]] bool mayBeQueried(const std::string& service, std::size_t at) const;
  /// Those that purge and do not look after themselves.
  [[nodiscard]] bool mayHavePeriodicWork(const std::string& service, std::size_t at) const;
  [[nodiscard]] bool mayWant(const std::string& service, const std::string& notification,
                             std::size_t at) const;

  /// Whom each snapshot taken from `at` on holds as purging, or to be queried.
  [[nodiscard]] std::vector<std::string> surelyPurging(std::size_t at) const;
  [[nodiscard]] std::vector<std::string> surelyQueried(std::size_t at) const;

  /// False for a service that is described twice: which of the two holds is left open here.
  [[nodiscard]] bool isClear(const std::string& service) const;
  /// Check-ins that were not refused.
  [[nodiscard]] const std::vector<const Call*>& checkIns() const { return check_ins_; }
  /// How many connections of services have ended so far, in the whole life.
  [[nodiscard]] std::size_t endedConnections() const { return ended_connections_; }

 private:
  const SystemStory& story_;
  std::vector<const Call*> check_ins_;
  std::size_t ended_connections_ = 0;
};

}  // namespace spacekeep::sim
