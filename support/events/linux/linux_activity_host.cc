#include "support/events/linux/linux_activity_host.h"

#include <fstream>
#include <utility>

#include "support/events/linux/event_files.h"
#include "support/events/linux/power_supply.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

LinuxActivityHost::LinuxActivityHost(std::shared_ptr<EventLoop> loop, Options options)
    : loop_(std::move(loop)), options_(std::move(options)) {}

void LinuxActivityHost::post(Callback callback) { loop_->post(std::move(callback)); }

void LinuxActivityHost::wakeAt(std::uint64_t boot_ns, Callback fired) {
  fired_ = std::move(fired);
  if (!timer_) {
    timer_.emplace(*loop_, [this] {
      const Callback due = std::move(fired_);
      fired_ = nullptr;
      if (due) due();  // may set the next time
    });
  }
  timer_->setFor(boot_ns);
}

void LinuxActivityHost::whenWallClockIsSet(Callback set) {
  wall_clock_watch_.emplace(*loop_, std::move(set));
}

Clocks LinuxActivityHost::readClocks() { return readSystemClocks(); }

bool LinuxActivityHost::onMainsPower() {
  return spacekeep::onMainsPower(options_.power_supply_directory);
}

std::optional<RunRecord> LinuxActivityHost::loadRecord() {
  return loadRunRecord(options_.record_path);
}

std::optional<std::string> LinuxActivityHost::saveRecord(const RunRecord& record) {
  return saveRunRecord(options_.record_path, record);
}

Clocks readSystemClocks() {
  Clocks clocks{.wall_ns = rt::wallClockNs(), .boot_ns = bootClockNs(), .boot_id = {}};
  std::ifstream("/proc/sys/kernel/random/boot_id") >> clocks.boot_id;
  return clocks;
}

}  // namespace spacekeep
