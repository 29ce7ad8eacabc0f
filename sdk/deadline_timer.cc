#include "sdk/deadline_timer.h"

#include <systemd/sd-event.h>

#include <ctime>
#include <utility>

namespace spacekeep::sdk {

/// Touched on the IPC thread only, once the timer is made.
struct DeadlineTimer::Slot {
  std::function<void()> fire;
  sd_event_source* source = nullptr;
  bool taken_back = false;
  std::shared_ptr<Slot> while_armed;  ///< the event source knows the slot by a plain pointer

  void arm(sd_event* event, std::uint64_t duration_ns, std::shared_ptr<Slot> self) {
    constexpr std::uint64_t kAccuracyUs = 1000;
    if (taken_back) return;
    if (sd_event_add_time_relative(event, &source, CLOCK_MONOTONIC, duration_ns / 1000, kAccuracyUs,
                                   &Slot::onTime, this) < 0) {
      // Out of memory or of the clock's range: better a deadline at once than none at all.
      fire();
      return;
    }
    while_armed = std::move(self);
  }

  void disarm() {
    taken_back = true;
    source = sd_event_source_disable_unref(source);
    const auto last = std::move(while_armed);
  }

  static int onTime(sd_event_source* /*source*/, std::uint64_t /*usec*/, void* slot_pointer) {
    auto* slot = static_cast<Slot*>(slot_pointer);
    const auto keep = slot->while_armed;
    slot->disarm();
    slot->fire();
    return 0;
  }
};

DeadlineTimer::DeadlineTimer(ipc::IpcLoop& loop, std::uint64_t duration_ns,
                             std::function<void()> fire)
    : loop_(loop), slot_(std::make_shared<Slot>()) {
  slot_->fire = std::move(fire);
  loop_.post([&ipc_loop = loop_, slot = slot_, duration_ns] {
    slot->arm(ipc_loop.event(), duration_ns, slot);
  });
}

DeadlineTimer::~DeadlineTimer() {
  loop_.post([slot = slot_] { slot->disarm(); });
}

}  // namespace spacekeep::sdk
