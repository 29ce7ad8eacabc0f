#include "support/ipc/linux/user_pace.h"

#include <systemd/sd-event.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <utility>
#include <vector>

#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

namespace {

double nsPerTick() {
  const auto base = rt::timebase();
  return base ? static_cast<double>(base->numerator) / base->denominator : 0;
}

}  // namespace

UserPace::UserPace(IpcLoop& loop, const UserShareLimits& limits)
    : loop_(loop), limits_(limits), ns_per_tick_(nsPerTick()), shares_(limits) {}

bool UserPace::isLimited(uid_t uid) const {
  if (ns_per_tick_ <= 0) return false;  // without a clock nothing would ever come back
  return limits_.limits_privileged_users || (uid != 0 && uid != ::geteuid());
}

std::uint64_t UserPace::nowNs() const {
  return static_cast<std::uint64_t>(static_cast<double>(rt::ticks()) * ns_per_tick_);
}

void UserPace::spend(uid_t uid, std::uint64_t cost_ns) {
  if (isLimited(uid)) shares_.spend(uid, cost_ns, nowNs());
}

void UserPace::spendOnMessage(uid_t uid, std::size_t bytes) {
  spend(uid, limits_.message_ns + limits_.byte_ns * bytes);
}

void UserPace::spendOnCall(uid_t uid, bool is_long) {
  spend(uid, is_long ? limits_.long_call_ns : limits_.call_ns);
}

void UserPace::spendOnConnection(uid_t uid) { spend(uid, limits_.connection_ns); }

bool UserPace::mayGoOn(uid_t uid) const { return !isLimited(uid) || shares_.mayGoOn(uid, nowNs()); }

void UserPace::wait(uid_t uid, std::function<void()> resume) {
  if (closed_) return;
  waiting_[uid].push_back(std::move(resume));
  if (timer_ == nullptr) lookAgainLater();
}

std::size_t UserPace::waiting(uid_t uid) const {
  const auto found = waiting_.find(uid);
  return found == waiting_.end() ? 0 : found->second.size();
}

std::size_t UserPace::waiting() const {
  std::size_t all = 0;
  for (const auto& [uid, of_uid] : waiting_) all += of_uid.size();
  return all;
}

/// A timer that cannot be had must not hold up anybody for good.
void UserPace::lookAgainLater() {
  const std::uint64_t usec = std::max<std::uint64_t>(limits_.look_again_ns / 1000, 1);
  if (sd_event_add_time_relative(loop_.event(), &timer_, CLOCK_MONOTONIC, usec, 1000,
                                 &UserPace::onTimer, this) >= 0) {
    return;
  }
  for (auto& [uid, of_uid] : std::exchange(waiting_, {})) {
    for (auto& resume : of_uid) loop_.post(std::move(resume));
  }
}

int UserPace::onTimer(sd_event_source*, std::uint64_t, void* self) {
  auto* pace = static_cast<UserPace*>(self);
  pace->timer_ = sd_event_source_disable_unref(pace->timer_);
  pace->resumeSome();
  return 0;
}

/// A few connections of each user at a time: the first ones use up what there is, and to wake the
/// others for nothing costs as well.
void UserPace::resumeSome() {
  std::vector<std::function<void()>> resumed;
  for (auto& [uid, of_uid] : waiting_) {
    if (!mayGoOn(uid)) continue;
    for (std::size_t i = 0; i < limits_.resumed_at_once && !of_uid.empty(); ++i) {
      resumed.push_back(std::move(of_uid.front()));
      of_uid.pop_front();
    }
  }
  std::erase_if(waiting_, [](const auto& of_uid) { return of_uid.second.empty(); });
  if (!waiting_.empty()) lookAgainLater();
  // Last: what resumes may wait again.
  for (const auto& resume : resumed) resume();
}

void UserPace::close() {
  closed_ = true;
  timer_ = sd_event_source_disable_unref(timer_);
  const auto dropped = std::exchange(waiting_, {});
}

}  // namespace spacekeep::ipc
