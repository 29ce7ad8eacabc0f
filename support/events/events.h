// Thread safety: every member may be called from any thread; handlers run on the global concurrent
// queue unless stated otherwise.
//
// The outside events that set the daemon in motion, and what surrounds them.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "support/queues/concurrent_queue.h"
#include "support/values/value.h"

namespace spacekeep {

/// While at least one transaction is open the machine is told that the daemon is busy.
class KeepAlive {
 public:
  virtual ~KeepAlive() = default;
  virtual void begin() = 0;
  virtual void end() = 0;
};

/// Opens a transaction for its scope.
class KeepAliveTransaction {
 public:
  explicit KeepAliveTransaction(KeepAlive& keep_alive) : keep_alive_(keep_alive) {
    keep_alive_.begin();
  }
  ~KeepAliveTransaction() { keep_alive_.end(); }
  KeepAliveTransaction(const KeepAliveTransaction&) = delete;
  KeepAliveTransaction& operator=(const KeepAliveTransaction&) = delete;

 private:
  KeepAlive& keep_alive_;
};

enum class ActivityState : std::int32_t {
  kCheckIn = 0,
  kWait = 1,
  kRun = 2,
  kDefer = 3,
  kContinue = 4,
  kDone = 5
};

/// A scheduled background activity, as its handler sees it.
class Activity {
 public:
  virtual ~Activity() = default;
  [[nodiscard]] virtual ActivityState state() const = 0;
};

/// Where an event of the file-system stream has its flags: a number, absent for none.
inline constexpr const char* kEventFlagsKey = "_Flags";
/// The flags of low space, by the names that volume queries have for them.
inline constexpr std::uint64_t kVqLowDisk = 0x4;
inline constexpr std::uint64_t kVqVeryLowDisk = 0x200;

class EventSources {
 public:
  using ActivityHandler = std::function<void(Activity&)>;
  using StreamHandler = std::function<void(const Dictionary& event)>;

  virtual ~EventSources() = default;

  /// Calls `handler` when the activity checks in and each time it is due. The schedule comes from
  /// the launch file of that name, not from here.
  virtual void registerActivity(const std::string& name, ActivityHandler handler) = 0;
  /// Calls `handler` with each event of the stream, on `queue`.
  virtual void setStreamHandler(const std::string& stream, ConcurrentQueue& queue,
                                StreamHandler handler) = 0;
  /// Runs `handler` as a signal handler.
  virtual void installTerminationHandler(void (*handler)(int)) = 0;
  /// 0, or an errno value when the notification could not be posted.
  [[nodiscard]] virtual int postNotification(const std::string& name) = 0;
  /// Parks the calling thread for good.
  virtual void park() = 0;
};

}  // namespace spacekeep
