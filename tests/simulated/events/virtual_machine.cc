#include "tests/simulated/events/virtual_machine.h"

#include <mutex>
#include <utility>

#include "support/events/launch_file.h"

namespace spacekeep::test {

VirtualMachine::VirtualMachine()
    : wall_offset_ns_(rt::wallClockNs()), boot_ticks_(rt::ticks()), settled_ticks_(rt::ticks()) {}

void VirtualMachine::settle() {
  work_ns_ = workNsLocked();
  settled_ticks_ = rt::ticks();
}

std::uint64_t VirtualMachine::workNsLocked() const {
  return work_ns_ + (isAtWork() ? rt::ticks() - settled_ticks_ : 0);
}

void VirtualMachine::suspend() {
  const std::scoped_lock lock(mutex_);
  settle();
  suspended_ = true;
}

void VirtualMachine::resume() {
  const std::scoped_lock lock(mutex_);
  settle();
  suspended_ = false;
  changed_.notifyAll();
}

void VirtualMachine::powerOff() { daemonDown(); }

void VirtualMachine::powerOn() {
  const std::scoped_lock lock(mutex_);
  boot_ticks_ = rt::ticks();
  ++boots_;
}

void VirtualMachine::daemonUp() {
  const std::scoped_lock lock(mutex_);
  settle();
  daemon_up_ = true;
}

void VirtualMachine::daemonDown() {
  const std::scoped_lock lock(mutex_);
  settle();
  daemon_up_ = false;
}

void VirtualMachine::plugIn(bool on_mains) {
  const std::scoped_lock lock(mutex_);
  on_mains_ = on_mains;
}

void VirtualMachine::jumpWallClockNs(std::int64_t by_ns) {
  const std::scoped_lock lock(mutex_);
  wall_offset_ns_ += by_ns;
  ++clock_settings_;
  changed_.notifyAll();
}

void VirtualMachine::recordRun() {
  const std::scoped_lock lock(mutex_);
  runs_.push_back({.at_ns = rt::ticks(), .at_work_ns = workNsLocked()});
}

Clocks VirtualMachine::clocks() const {
  const std::scoped_lock lock(mutex_);
  return {.wall_ns = static_cast<std::int64_t>(rt::ticks()) + wall_offset_ns_,
          .boot_ns = rt::ticks() - boot_ticks_,
          .boot_id = "boot " + std::to_string(boots_)};
}

bool VirtualMachine::onMains() const {
  const std::scoped_lock lock(mutex_);
  return on_mains_;
}

std::optional<RunRecord> VirtualMachine::loadRecord() const {
  const std::scoped_lock lock(mutex_);
  return record_ ? runRecordFromDocument(*record_) : std::nullopt;
}

void VirtualMachine::saveRecord(const RunRecord& record) {
  const std::scoped_lock lock(mutex_);
  record_ = documentFromRunRecord(record);
  ++records_saved_;
}

std::vector<Run> VirtualMachine::runs() const {
  const std::scoped_lock lock(mutex_);
  return runs_;
}

std::uint64_t VirtualMachine::workNs() const {
  const std::scoped_lock lock(mutex_);
  return workNsLocked();
}

std::uint64_t VirtualMachine::recordsSaved() const {
  const std::scoped_lock lock(mutex_);
  return records_saved_;
}

VirtualHost::VirtualHost(VirtualMachine& machine)
    : machine_(machine),
      clock_settings_seen_(machine.clock_settings_),
      thread_("host", [this] { run(); }) {}

VirtualHost::~VirtualHost() { stop(); }

void VirtualHost::stop() {
  std::deque<Callback> dropped;
  {
    const std::scoped_lock lock(machine_.mutex_);
    stopping_ = true;
    dropped.swap(posted_);
    machine_.changed_.notifyAll();
  }
  if (thread_.joinable()) thread_.join();
}

void VirtualHost::post(Callback callback) {
  const std::scoped_lock lock(machine_.mutex_);
  if (stopping_) return;
  posted_.push_back(std::move(callback));
  machine_.changed_.notifyAll();
}

void VirtualHost::wakeAt(std::uint64_t boot_ns, Callback fired) {
  const std::scoped_lock lock(machine_.mutex_);
  wake_ticks_ = machine_.boot_ticks_ + boot_ns;
  fired_ = std::move(fired);
}

void VirtualHost::whenWallClockIsSet(Callback set) {
  const std::scoped_lock lock(machine_.mutex_);
  clock_set_ = std::move(set);
}

void VirtualHost::run() {
  while (const Callback callback = next()) callback();
}

ActivityHost::Callback VirtualHost::next() {
  const std::scoped_lock lock(machine_.mutex_);
  while (!stopping_) {
    if (machine_.suspended_) {
      machine_.changed_.wait(machine_.mutex_);
      continue;
    }
    if (Callback due = takeDue()) return due;
    machine_.changed_.waitUntil(machine_.mutex_, wake_ticks_);
  }
  return nullptr;
}

ActivityHost::Callback VirtualHost::takeDue() {
  if (clock_set_ && clock_settings_seen_ != machine_.clock_settings_) {
    clock_settings_seen_ = machine_.clock_settings_;
    return clock_set_;
  }
  if (!posted_.empty()) {
    Callback first = std::move(posted_.front());
    posted_.pop_front();
    return first;
  }
  if (rt::ticks() < wake_ticks_) return nullptr;
  wake_ticks_ = rt::kNever;
  return std::move(fired_);
}

}  // namespace spacekeep::test
