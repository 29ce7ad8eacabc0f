// Thread safety: plain values and pure functions.
//
// The verdict over one entitlement of one peer. Rules are small and independent of each other:
// their order does not matter.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "support/access/peer_identity.h"

namespace spacekeep::access {

/// Whom a rule is about, and what it says of them. Each condition that is present must hold; it
/// holds when one of its alternatives does, so a condition without alternatives never holds.
struct Rule {
  std::string name;              ///< of the file it stands in
  bool matches_anybody = false;  ///< without any condition a rule matches nobody unless this is set
  std::optional<std::vector<std::uint32_t>> users;
  std::optional<std::vector<std::uint32_t>> groups;  ///< primary or supplementary
  bool users_left_open = false;  ///< it is not known whom a name among them stands for
  bool groups_left_open = false;
  std::optional<std::vector<std::string>> units;
  std::optional<std::vector<std::string>> labels;
  std::vector<std::string> grants;
  std::vector<std::string> denies;
};

/// By what is known for certain: what counts for grants.
[[nodiscard]] bool matches(const Rule& rule, const PeerIdentity& identity);
/// The same, or it cannot be ruled out: what counts for denials.
[[nodiscard]] bool mayMatch(const Rule& rule, const PeerIdentity& identity);

enum class Decision {
  kGranted,
  kDenied,  ///< by a rule
  kSilent,  ///< no rule speaks of it, which denies as well
};

struct Verdict {
  Decision decision = Decision::kSilent;
  std::string rule;   ///< the rule that decided, empty when none did
  bool open = false;  ///< whether the rule is about the peer is unclear, which denies as well
  [[nodiscard]] bool granted() const { return decision == Decision::kGranted; }
};

/// A denial wins over any number of grants. Of several rules that say the same the first is named.
[[nodiscard]] Verdict judge(std::span<const Rule> rules, const PeerIdentity& identity,
                            std::string_view entitlement);

}  // namespace spacekeep::access
