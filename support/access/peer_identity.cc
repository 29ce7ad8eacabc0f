#include "support/access/peer_identity.h"

#include <algorithm>
#include <atomic>
#include <utility>

namespace spacekeep::access {
namespace {

std::uint64_t nextSerial() {
  static std::atomic<std::uint64_t> last{0};
  return last.fetch_add(1, std::memory_order_relaxed) + 1;
}

PeerFacts withoutUnvouchedUnit(PeerFacts facts) {
  if (facts.pidfd == nullptr) facts.unit.reset();
  return facts;
}

}  // namespace

PeerIdentity::PeerIdentity(PeerFacts facts)
    : facts_(withoutUnvouchedUnit(std::move(facts))), serial_(nextSerial()) {}

bool PeerIdentity::isMemberOf(std::uint32_t group) const {
  return facts_.gid == group || std::ranges::find(facts_.groups, group) != facts_.groups.end();
}

std::string PeerIdentity::describe() const {
  const std::string gid = facts_.gid == kNoGroup ? "unknown" : std::to_string(facts_.gid);
  std::string text =
      "uid " + std::to_string(facts_.uid) + " gid " + gid + " pid " + std::to_string(facts_.pid);
  if (facts_.unit) text += " unit " + *facts_.unit;
  return text;
}

}  // namespace spacekeep::access
