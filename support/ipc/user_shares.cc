#include "support/ipc/user_shares.h"

namespace spacekeep::ipc {

namespace {

// Looking through a few records at times costs nothing, and more users than that are rare.
constexpr std::size_t kRecordsKept = 64;

}  // namespace

std::uint64_t UserShares::spentAt(const User& user, std::uint64_t now_ns) const {
  if (now_ns <= user.at_ns) return user.spent_ns;
  // Dividing first keeps the product small whatever the clock says.
  const std::uint64_t back_ns = (now_ns - user.at_ns) / 100 * limits_.percent;
  return back_ns >= user.spent_ns ? 0 : user.spent_ns - back_ns;
}

void UserShares::spend(Uid uid, std::uint64_t cost_ns, std::uint64_t now_ns) {
  User& user = users_[uid];
  user.spent_ns = spentAt(user, now_ns) + cost_ns;
  user.at_ns = user.at_ns < now_ns ? now_ns : user.at_ns;
  if (users_.size() > kRecordsKept) forgetQuietOnes(now_ns);
}

bool UserShares::mayGoOn(Uid uid, std::uint64_t now_ns) const {
  const auto found = users_.find(uid);
  return found == users_.end() || spentAt(found->second, now_ns) <= limits_.saved_ns;
}

void UserShares::forgetQuietOnes(std::uint64_t now_ns) {
  std::erase_if(users_,
                [this, now_ns](const auto& of_uid) { return spentAt(of_uid.second, now_ns) == 0; });
}

}  // namespace spacekeep::ipc
