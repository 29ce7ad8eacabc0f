// Thread safety: every member may be called from any thread.
//
// The outside events, set off by hand.
#pragma once

#include <cstdint>
#include <map>
#include <string>
#include <vector>

#include "sim/world/trace.h"
#include "support/events/events.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class CountingKeepAlive final : public KeepAlive {
 public:
  CountingKeepAlive() = default;
  explicit CountingKeepAlive(Trace& trace) : trace_(&trace) {}
  void begin() override;
  void end() override;
  [[nodiscard]] std::int64_t open() const;
  [[nodiscard]] std::uint64_t begun() const;
  /// True when end() was once called more often than begin().
  [[nodiscard]] bool wentNegative() const;
  /// Waits until no transaction is open, without any time limit.
  void waitUntilIdle();

 private:
  void changed();  // with mutex_ held

  Trace* trace_ = nullptr;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::int64_t open_ = 0;
  std::uint64_t begun_ = 0;
  bool went_negative_ = false;
  rt::CondVar idle_;
};

class SimulatedEventSources final : public EventSources {
 public:
  explicit SimulatedEventSources(ConcurrentQueue& global) : global_(global) {}

  void registerActivity(const std::string& name, ActivityHandler handler) override;
  void setStreamHandler(const std::string& stream, ConcurrentQueue& queue,
                        StreamHandler handler) override;
  void installTerminationHandler(void (*handler)(int)) override;
  [[nodiscard]] int postNotification(const std::string& name) override;
  /// Waits until unpark().
  void park() override;
  void waitUntilParked();

  /// Runs the activity's handler in that state on the global queue. False when nobody registered.
  bool runActivity(const std::string& name, ActivityState state);
  /// Sends one event to the stream's handler, on its queue. False when nobody listens.
  bool send(const std::string& stream, const Dictionary& event);
  void unpark();
  /// What postNotification answers from now on.
  void setNotificationResult(int result);

  [[nodiscard]] std::vector<std::string> postedNotifications() const;
  [[nodiscard]] std::vector<std::string> registeredActivities() const;
  [[nodiscard]] bool parked() const;
  [[nodiscard]] void (*terminationHandler() const)(int);
  void abandon();

 private:
  struct Stream {
    ConcurrentQueue* queue = nullptr;
    StreamHandler handler;
  };

  ConcurrentQueue& global_;
  CountingSemaphore unparked_{0};
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<std::string, ActivityHandler> activities_;
  std::map<std::string, Stream> streams_;
  std::vector<std::string> notifications_;
  void (*termination_handler_)(int) = nullptr;
  int notification_result_ = 0;
  bool parked_ = false;
  rt::CondVar has_parked_;
};

}  // namespace spacekeep::sim
