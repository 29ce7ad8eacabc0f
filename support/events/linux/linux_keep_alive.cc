#include "support/events/linux/linux_keep_alive.h"

#include <systemd/sd-daemon.h>

#include <optional>
#include <utility>

namespace spacekeep {

/// Shared with the tasks that are under way when the keep-alive ends.
struct LinuxKeepAlive::Inhibition : std::enable_shared_from_this<Inhibition> {
  Inhibition(ConcurrentQueue& global, TakeInhibitor take)
      : take_inhibitor(std::move(take)),
        queue(SerialQueue::create("com.quorvel.spacekeep_inhibitor", global)) {}

  /// On the loop's thread.
  void becomeBusy(EventLoop& loop, std::uint64_t at_boot_ns) {
    if (!timer) timer.emplace(loop, [this] { hold(); });
    timer->setFor(at_boot_ns);
  }
  void becomeIdle() {
    if (timer) timer->cancel();
    queue->async([self = shared_from_this()] { self->inhibitor = nullptr; });
  }
  void hold() {
    queue->async([self = shared_from_this()] {
      if (self->inhibitor == nullptr) self->inhibitor = self->take_inhibitor();
    });
  }

  const TakeInhibitor take_inhibitor;
  const std::shared_ptr<SerialQueue> queue;  // the login manager may be slow: not on the loop
  std::optional<BootTimer> timer;            // confined to the loop's thread
  ipc::SharedDescriptor inhibitor;           // confined to queue
};

LinuxKeepAlive::LinuxKeepAlive(std::shared_ptr<EventLoop> loop, ConcurrentQueue& global,
                               TakeInhibitor take_inhibitor, std::uint64_t inhibit_after_ns)
    : loop_(std::move(loop)),
      inhibit_after_ns_(inhibit_after_ns),
      inhibition_(std::make_shared<Inhibition>(global, std::move(take_inhibitor))),
      count_([this](bool busy) { changed(busy); }) {}

LinuxKeepAlive::~LinuxKeepAlive() {
  loop_->stop();
  inhibition_->timer.reset();  // it refers to the loop, which a late task must not keep needing
}

void LinuxKeepAlive::changed(bool busy) {
  sd_notify(0, busy ? "STATUS=Working." : "STATUS=Idle.");
  if (busy) {
    loop_->post(
        [loop = loop_.get(), held = inhibition_, at_boot_ns = bootClockNs() + inhibit_after_ns_] {
          held->becomeBusy(*loop, at_boot_ns);
        });
  } else {
    loop_->post([held = inhibition_] { held->becomeIdle(); });
  }
}

}  // namespace spacekeep
