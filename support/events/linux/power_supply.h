// Thread safety: may be called from any thread.
#pragma once

#include <string>

namespace spacekeep {

/// Whether the machine runs on mains power, by what the kernel tells in `directory`
/// (/sys/class/power_supply; Documentation/ABI/testing/sysfs-class-power). A machine without a
/// battery of its own does; one with a battery does while any of its chargers is online.
[[nodiscard]] bool onMainsPower(const std::string& directory = "/sys/class/power_supply");

}  // namespace spacekeep
