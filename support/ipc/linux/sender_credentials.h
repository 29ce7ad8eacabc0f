// Thread safety: confined to the IPC thread, like the message.
//
// Who sent a message over a bus, as the broker answers "GetConnectionCredentials" ("Message Bus
// Messages" of the D-Bus specification). The broker took it from the kernel when the sender connected.
#pragma once

#include <systemd/sd-bus.h>

#include <memory>

#include "support/access/peer_identity.h"

namespace spacekeep::ipc {

/// Null when the answer does not name the user: such a sender is to be refused. What else is missing
/// is unclear in the identity. A process number alone says nothing about a unit, since it may belong
/// to somebody else by now; only a broker that passes on the process itself ("ProcessFD") makes the
/// unit known.
[[nodiscard]] std::shared_ptr<const access::PeerIdentity> identityFromCredentials(
    sd_bus_message* answer);

}  // namespace spacekeep::ipc
