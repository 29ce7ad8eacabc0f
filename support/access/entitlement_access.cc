#include "support/access/entitlement_access.h"

#include <algorithm>
#include <mutex>

#include "support/logging/log.h"

namespace spacekeep::access {

EntitlementAccess::EntitlementAccess(std::vector<Rule> rules, std::size_t max_remembered)
    : rules_(std::move(rules)), max_remembered_(std::max<std::size_t>(max_remembered, 1)) {}

bool EntitlementAccess::connectionIsEntitled(ipc::PeerConnection* connection,
                                             std::initializer_list<std::string_view> entitlements) {
  if (connection == nullptr) return false;
  return std::ranges::all_of(entitlements, [&](std::string_view entitlement) {
    return isEntitled(connection->identity(), entitlement);
  });
}

bool EntitlementAccess::isEntitled(const PeerIdentity& identity, std::string_view entitlement) {
  const Key key{identity.serial(), std::string(entitlement)};
  {
    const std::scoped_lock lock(mutex_);
    if (const auto known = verdicts_.find(key); known != verdicts_.end()) return known->second;
  }
  // Judged without the lock: two threads may both judge, the result is the same and one logs it.
  const Verdict verdict = judge(rules_, identity, entitlement);
  if (remember(key, verdict.granted())) logVerdict(identity, entitlement, verdict);
  return verdict.granted();
}

std::size_t EntitlementAccess::remembered() const {
  const std::scoped_lock lock(mutex_);
  return verdicts_.size();
}

bool EntitlementAccess::remember(const Key& key, bool granted) {
  const std::scoped_lock lock(mutex_);
  if (!verdicts_.emplace(key, granted).second) return false;
  oldest_first_.push_back(key);
  if (oldest_first_.size() > max_remembered_) {
    verdicts_.erase(oldest_first_.front());
    oldest_first_.pop_front();
  }
  return true;
}

void EntitlementAccess::logVerdict(const PeerIdentity& identity, std::string_view entitlement,
                                   const Verdict& verdict) {
  constexpr const char* kOperation = "connectionIsEntitled";
  if (verdict.granted()) {
    refusal_lines_.tellLeftOut();
    logTrace("%s peer %s holds %s by rule %s", kOperation, identity.describe(), entitlement,
             verdict.rule);
    return;
  }
  if (!refusal_lines_.admit(identity.uid(), entitlement)) return;
  if (verdict.decision == Decision::kSilent) {
    logProblem("%s peer %s lacks %s, no rule grants it", kOperation, identity.describe(),
               entitlement);
    return;
  }
  logProblem("%s peer %s is denied %s by rule %s%s", kOperation, identity.describe(), entitlement,
             verdict.rule, verdict.open ? ", which may be about it: that is unclear" : "");
}

}  // namespace spacekeep::access
