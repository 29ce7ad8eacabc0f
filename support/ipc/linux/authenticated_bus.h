// Thread safety: confined to the IPC thread, like the object it makes.
//
// An sd_bus object over a socket whose handshake is already done.
#pragma once

struct sd_bus;

namespace spacekeep::ipc {

/// What becomes of descriptors that the peer sends along.
enum class BusDescriptors {
  kClosed,  ///< and the bus fails; none can be sent either
  kTaken,   ///< those of a malformed message stay open (libsystemd 252): only where none can come
};

/// sd-bus cannot start in the middle, so it goes through its handshake with this process over a
/// socket pair, and then finds the peer's socket under the same descriptor. Takes a duplicate of
/// `socket`. Null when descriptors or memory are used up. The bus is not connected to any broker.
[[nodiscard]] sd_bus* makeAuthenticatedBus(int socket,
                                           BusDescriptors descriptors = BusDescriptors::kTaken);

}  // namespace spacekeep::ipc
