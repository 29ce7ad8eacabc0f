// Thread safety: every member may be called from any thread.
//
// Keep-alive transactions on Linux: while one is open the service manager shows the daemon as busy,
// and one that stays open for a while keeps the machine from being suspended.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>

#include "support/events/events.h"
#include "support/events/keep_alive_count.h"
#include "support/events/linux/event_loop.h"
#include "support/ipc/arguments.h"
#include "support/queues/serial_queue.h"

namespace spacekeep {

class LinuxKeepAlive final : public KeepAlive {
 public:
  /// Takes an inhibitor that lasts until its descriptor is closed; null when there is none to take.
  using TakeInhibitor = std::function<ipc::SharedDescriptor()>;

  /// Most transactions are over within this time, and are not worth a round trip to the login
  /// manager.
  static constexpr std::uint64_t kInhibitAfterNs = 1'000'000'000;

  LinuxKeepAlive(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global,
                 TakeInhibitor take_inhibitor, std::uint64_t inhibit_after_ns = kInhibitAfterNs);
  ~LinuxKeepAlive() override;
  LinuxKeepAlive(const LinuxKeepAlive&) = delete;
  LinuxKeepAlive& operator=(const LinuxKeepAlive&) = delete;

  void begin() override { count_.begin(); }
  void end() override { count_.end(); }

 private:
  struct Inhibition;

  void changed(bool busy);

  const std::shared_ptr<EventLoop> loop_;
  const std::uint64_t inhibit_after_ns_;
  const std::shared_ptr<Inhibition> inhibition_;
  KeepAliveCount count_;
};

}  // namespace spacekeep
