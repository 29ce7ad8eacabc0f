// Thread safety: every member may be called from any thread.
//
// A machine with a boot clock, a wall clock, a battery, suspends and restarts, in virtual time. What
// runs on it is the real activity; the machine only is what it stands on.
#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "support/events/daily_activity.h"
#include "support/runtime/runtime.h"
#include "support/values/value.h"

namespace spacekeep::test {

/// A run of the activity: when by the true time, and how much time the daemon had been up and the
/// machine awake until then.
struct Run {
  std::uint64_t at_ns = 0;
  std::uint64_t at_work_ns = 0;
};

class VirtualMachine {
 public:
  VirtualMachine();

  // What happens to it.
  void suspend();
  void resume();
  void powerOff();
  void powerOn();
  void daemonUp();
  void daemonDown();
  void plugIn(bool on_mains);
  /// Tells the watch, where there is one.
  void jumpWallClockNs(std::int64_t by_ns);
  void recordRun();

  // What runs on it sees.
  [[nodiscard]] Clocks clocks() const;
  [[nodiscard]] bool onMains() const;
  [[nodiscard]] std::optional<RunRecord> loadRecord() const;
  void saveRecord(const RunRecord& record);

  // What became of it.
  [[nodiscard]] std::vector<Run> runs() const;
  [[nodiscard]] std::uint64_t workNs() const;
  [[nodiscard]] std::uint64_t recordsSaved() const;

 private:
  friend class VirtualHost;

  [[nodiscard]] bool isAtWork() const { return daemon_up_ && !suspended_; }
  [[nodiscard]] std::uint64_t workNsLocked() const;
  void settle();

  mutable rt::Mutex mutex_;
  // Protected by mutex_. Virtual ticks are nanoseconds of the true time.
  rt::CondVar changed_;
  std::int64_t wall_offset_ns_;
  std::uint64_t boot_ticks_;
  unsigned boots_ = 1;
  bool suspended_ = false;
  bool on_mains_ = true;
  bool daemon_up_ = false;
  std::uint64_t work_ns_ = 0;
  std::uint64_t settled_ticks_;
  std::optional<Value> record_;  // as the document on disk
  std::uint64_t records_saved_ = 0;
  std::uint64_t clock_settings_ = 0;
  std::vector<Run> runs_;
};

/// The thread and the timer of one daemon on it. Nothing runs while the machine is suspended.
class VirtualHost final : public ActivityHost {
 public:
  explicit VirtualHost(VirtualMachine& machine);
  ~VirtualHost() override;
  VirtualHost(const VirtualHost&) = delete;
  VirtualHost& operator=(const VirtualHost&) = delete;
  /// What has not begun is dropped.
  void stop();

  void post(Callback callback) override;
  void wakeAt(std::uint64_t boot_ns, Callback fired) override;
  void whenWallClockIsSet(Callback set) override;
  [[nodiscard]] Clocks readClocks() override { return machine_.clocks(); }
  [[nodiscard]] bool onMainsPower() override { return machine_.onMains(); }
  [[nodiscard]] std::optional<RunRecord> loadRecord() override { return machine_.loadRecord(); }
  [[nodiscard]] std::optional<std::string> saveRecord(const RunRecord& record) override {
    machine_.saveRecord(record);
    return std::nullopt;
  }

 private:
  void run();
  /// The next thing to do, none when the host stops.
  Callback next();
  [[nodiscard]] Callback takeDue();

  VirtualMachine& machine_;
  // Protected by the machine's mutex.
  bool stopping_ = false;
  std::deque<Callback> posted_;
  std::uint64_t wake_ticks_ = rt::kNever;
  Callback fired_;
  Callback clock_set_;
  std::uint64_t clock_settings_seen_ = 0;
  rt::Thread thread_;  // last: it uses all of the above
};

}  // namespace spacekeep::test
