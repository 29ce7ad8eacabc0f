// Thread safety: confined to the IPC thread.
//
// Whether the process behind a closed connection has died, or has only closed its end. A process
// that dies closes its descriptors before the kernel announces its death, so the question has to
// wait for a moment.
#pragma once

#include <cstdint>
#include <functional>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/ipc_loop.h"

namespace spacekeep::ipc {

class PeerProcess {
 public:
  explicit PeerProcess(IpcLoop& loop) : loop_(loop) {}
  ~PeerProcess();
  PeerProcess(const PeerProcess&) = delete;
  PeerProcess& operator=(const PeerProcess&) = delete;

  /// Remembers who holds the other end of the connected socket.
  void remember(int socket);
  /// Runs `done` once: with true as soon as the process is known to be dead, with false when it
  /// still lives after `patience_ns` or was never known. Possibly within this call.
  void whenKnown(std::uint64_t patience_ns, std::function<void(bool died)> done);
  /// `done` is not run any more.
  void forget();

 private:
  static int onDeath(sd_event_source*, int fd, std::uint32_t events, void* self);
  static int onPatienceEnd(sd_event_source*, std::uint64_t usec, void* self);
  void tell(bool died);
  void stopWatching();

  IpcLoop& loop_;
  SharedDescriptor pidfd_;
  bool died_already_ = false;
  std::function<void(bool)> done_;
  sd_event_source* death_ = nullptr;
  sd_event_source* patience_ = nullptr;
};

}  // namespace spacekeep::ipc
