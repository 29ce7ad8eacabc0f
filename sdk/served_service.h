// Thread safety: every member may be called from any thread.
//
// A Service as the wire sees it: decodes the seven operations into jobs, runs the handlers on their
// lanes, and keeps the cancellations of what runs or waits.
#pragma once

#include <spacekeep/service.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>

#include "support/ipc/served.h"
#include "support/queues/serial_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sdk {

class ServedService : public std::enable_shared_from_this<ServedService> {
 public:
  /// `global` must outlive the object and be destroyed only after the last connection has ended.
  ServedService(std::shared_ptr<Service> service, Handlers handlers, ConcurrentQueue& global);

  /// The interface to serve. It keeps this object alive.
  [[nodiscard]] ipc::ServedInterface interface();
  /// Everything that runs or waits, of whatever kind.
  void cancelAll();

  struct Activity {
    std::size_t pending = 0;            ///< jobs that run or wait
    std::uint64_t last_call_ticks = 0;  ///< when something was last asked for or answered
  };
  [[nodiscard]] Activity activity() const;
  /// Something began that is likely to bring a call, or did.
  void noteCall();
  /// Until no job runs or waits. No connection may be left that could bring another one.
  void waitUntilIdle();

 private:
  enum class Kind { kPurgeable, kPurge, kPeriodic, kNotify, kCallback, kCount };
  using Work = std::function<ipc::Arguments(Service&, const Cancellation&)>;

  ipc::ServedMethod jobMethod(const char* name, Kind kind,
                              Answer (Service::*handler)(const Job& job));
  ipc::ServedMethod notifyMethod();
  ipc::ServedMethod callbackMethod();
  ipc::ServedMethod cancelMethod();
  ipc::ServedMethod pingMethod();

  /// Runs `work` on the lane of its kind and answers with what it returns.
  void enqueue(Kind kind, ipc::Responder responder, Work work);
  void run(const Work& work, const Cancellation& cancellation, ipc::Responder responder);
  void cancelPurges();

  struct Pending {
    Kind kind;
    Cancellation cancellation;
  };

  const std::shared_ptr<Service> service_;
  std::shared_ptr<SerialQueue> lanes_[static_cast<std::size_t>(Kind::kCount)];  ///< may be shared
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar became_idle_;
  std::map<std::uint64_t, Pending> pending_;  ///< by order of arrival
  std::uint64_t next_number_ = 0;
  std::uint64_t last_call_ticks_ = 0;
};

}  // namespace spacekeep::sdk
