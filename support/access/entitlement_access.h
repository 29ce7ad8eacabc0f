// Thread safety: every member may be called from any thread.
//
// Answers for the rest of the system who may do what, by the rules that it was made with.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <map>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "support/access/access.h"
#include "support/access/entitlement_rules.h"
#include "support/access/refusal_lines.h"
#include "support/runtime/runtime.h"

namespace spacekeep::access {

class EntitlementAccess final : public Access {
 public:
  /// Verdicts remembered at most; beyond that the oldest are forgotten, and asked for again they
  /// are judged and logged again.
  static constexpr std::size_t kMaxRemembered = 4096;

  explicit EntitlementAccess(std::vector<Rule> rules, std::size_t max_remembered = kMaxRemembered);

  [[nodiscard]] bool connectionIsEntitled(
      ipc::PeerConnection* connection,
      std::initializer_list<std::string_view> entitlements) override;

  /// The same for one entitlement of a peer that has no connection object yet. Each verdict is
  /// logged once per identity, a refusal as a problem, and of those only so many in a while.
  [[nodiscard]] bool isEntitled(const PeerIdentity& identity, std::string_view entitlement);

  [[nodiscard]] std::size_t remembered() const;

 private:
  using Key = std::pair<std::uint64_t, std::string>;  // serial of the identity, entitlement

  /// Answers whether the verdict is new.
  bool remember(const Key& key, bool granted);
  void logVerdict(const PeerIdentity& identity, std::string_view entitlement,
                  const Verdict& verdict);

  const std::vector<Rule> rules_;
  const std::size_t max_remembered_;
  RefusalLines refusal_lines_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<Key, bool> verdicts_;
  std::deque<Key> oldest_first_;
};

}  // namespace spacekeep::access
