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

/// It closes both descriptors. They are duplicates of one socket, so that something else can be put
/// in the place of the one for reading (dup2(2)) for as long as it is only to write.
struct AuthenticatedBus {
  sd_bus* bus = nullptr;
  int input = -1;
  int output = -1;
};

/// sd-bus cannot start in the middle, so it goes through its handshake with this process over a
/// socket pair, and then finds the peer's socket under the same descriptors. Takes duplicates of
/// `socket`. No bus when descriptors or memory are used up. It is not connected to any broker.
[[nodiscard]] AuthenticatedBus makeAuthenticatedBus(
    int socket, BusDescriptors descriptors = BusDescriptors::kTaken);

}  // namespace spacekeep::ipc
