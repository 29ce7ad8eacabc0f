// Thread safety: may be called from any thread; each call makes its own connection and may wait for
// the bus, for a few seconds at most where the bus answers at all.
//
// The two things that the daemon asks of the system bus. Neither is needed for its work: without a
// bus both do nothing.
#pragma once

#include <optional>
#include <string>

#include "support/ipc/arguments.h"

namespace spacekeep {

inline constexpr const char* kSystemBusSocket = "/run/dbus/system_bus_socket";

/// Sends the signal "<everything before the last dot>.<rest>" from "/com/quorvel/Spacekeep".
/// Answers 0, or an errno value; ENOENT where there is no bus.
[[nodiscard]] int emitSystemSignal(const std::string& bus_socket, const std::string& name);

/// Asks the login manager not to suspend the machine (org.freedesktop.login1(5), Inhibit with
/// "sleep" and "block") until the descriptor is closed. Null when there is none to ask, or it
/// refuses.
[[nodiscard]] ipc::SharedDescriptor inhibitSleep(const std::string& bus_socket,
                                                 const std::string& why);

}  // namespace spacekeep
