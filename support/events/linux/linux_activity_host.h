// Thread safety: post() may be called from any thread, everything else on the loop's thread, or once
// the loop was stopped.
//
// A scheduled activity's clocks, timer, power and disk on Linux.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "support/events/daily_activity.h"
#include "support/events/linux/event_loop.h"

namespace spacekeep {

class LinuxActivityHost final : public ActivityHost {
 public:
  struct Options {
    std::string record_path;  ///< where the last run is remembered
    std::string power_supply_directory = "/sys/class/power_supply";
  };

  LinuxActivityHost(std::shared_ptr<EventLoop> loop, Options options);

  void post(Callback callback) override;
  void wakeAt(std::uint64_t boot_ns, Callback fired) override;
  void whenWallClockIsSet(Callback set) override;
  [[nodiscard]] Clocks readClocks() override;
  [[nodiscard]] bool onMainsPower() override;
  [[nodiscard]] std::optional<RunRecord> loadRecord() override;
  [[nodiscard]] std::optional<std::string> saveRecord(const RunRecord& record) override;

 private:
  const std::shared_ptr<EventLoop> loop_;
  const Options options_;
  // Confined to the loop's thread.
  Callback fired_;
  std::optional<BootTimer> timer_;
  std::optional<WallClockWatch> wall_clock_watch_;
};

/// The clocks of this machine.
[[nodiscard]] Clocks readSystemClocks();

}  // namespace spacekeep
