// Thread safety: confined to the IPC thread; may be destroyed elsewhere once it is closed.
//
// Holds up what users do who have used up their share of the IPC thread, until it has come back: one
// user who sends as fast as the sockets take it leaves most of the processor to everybody else.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <map>

#include "support/ipc/linux/ipc_loop.h"
#include "support/ipc/user_shares.h"

namespace spacekeep::ipc {

class UserPace {
 public:
  UserPace(IpcLoop& loop, const UserShareLimits& limits);
  ~UserPace() { close(); }
  UserPace(const UserPace&) = delete;
  UserPace& operator=(const UserPace&) = delete;

  void spendOnMessage(uid_t uid, std::size_t bytes);
  void spendOnCall(uid_t uid, bool is_long);
  void spendOnConnection(uid_t uid);
  [[nodiscard]] bool mayGoOn(uid_t uid) const;
  /// Runs `resume` once the user may go on, after those of the same user that wait already. Dropped
  /// when this is closed.
  void wait(uid_t uid, std::function<void()> resume);
  [[nodiscard]] std::size_t waiting(uid_t uid) const;
  /// Of all users.
  [[nodiscard]] std::size_t waiting() const;
  /// Nothing waits or resumes any more.
  void close();

 private:
  static int onTimer(sd_event_source*, std::uint64_t usec, void* self);
  [[nodiscard]] std::uint64_t nowNs() const;
  [[nodiscard]] bool isLimited(uid_t uid) const;
  void spend(uid_t uid, std::uint64_t cost_ns);
  void lookAgainLater();
  void resumeSome();

  IpcLoop& loop_;
  const UserShareLimits limits_;
  const double ns_per_tick_;
  UserShares shares_;
  std::map<uid_t, std::deque<std::function<void()>>> waiting_;  // no empty ones
  sd_event_source* timer_ = nullptr;
  bool closed_ = false;
};

}  // namespace spacekeep::ipc
