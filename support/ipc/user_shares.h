// Thread safety: confined to one thread at a time.
//
// What each user may have of the one thread that all messages go through. A user who was quiet has
// some of it saved; whoever uses it up has to wait until it comes back. The costs are nominal, so
// that no clock is read for a message and the same traffic always costs the same.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>

namespace spacekeep::ipc {

struct UserShareLimits {
  std::uint64_t percent = 25;               ///< of the time
  std::uint64_t saved_ns = 100'000'000;     ///< the most that a quiet user has saved
  std::uint64_t message_ns = 30'000;        ///< cost of any message
  std::uint64_t byte_ns = 1;                ///< and of each byte of it
  std::uint64_t call_ns = 30'000;           ///< and of serving it
  std::uint64_t long_call_ns = 1'000'000;   ///< and of serving one that runs for a while
  std::uint64_t connection_ns = 200'000;    ///< cost of a new connection
  std::uint64_t look_again_ns = 5'000'000;  ///< how often those that wait are looked at
  std::size_t resumed_at_once = 16;         ///< connections of one user, each time
  /// Root can do anything anyway, and the server's own user is who runs it.
  bool limits_privileged_users = false;
};

class UserShares {
 public:
  using Uid = std::uint32_t;

  explicit UserShares(const UserShareLimits& limits) : limits_(limits) {}

  /// Time never goes back; a reading that does counts as none.
  void spend(Uid uid, std::uint64_t cost_ns, std::uint64_t now_ns);
  /// False while the user has spent more than came back.
  [[nodiscard]] bool mayGoOn(Uid uid, std::uint64_t now_ns) const;
  /// Users who have not everything saved. The others need no record.
  [[nodiscard]] std::size_t known() const { return users_.size(); }

 private:
  struct User {
    std::uint64_t spent_ns = 0;  // and has not come back
    std::uint64_t at_ns = 0;     // when that was so
  };
  [[nodiscard]] std::uint64_t spentAt(const User& user, std::uint64_t now_ns) const;
  void forgetQuietOnes(std::uint64_t now_ns);

  const UserShareLimits limits_;
  std::map<Uid, User> users_;
};

}  // namespace spacekeep::ipc
