// Thread safety: confined to the IPC thread.
//
// Whether the process behind a closed connection has died, or has only closed its end. A process
// that dies closes its descriptors before the kernel announces its death; that it is about to is
// written in proc(5). Where that cannot be read, the question has to wait for a moment.
#pragma once

#include <sys/types.h>

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

  /// Remembers who holds the other end of the connected socket: who has made the pair, or had
  /// listened last when it connected. A connection that made the service manager start its peer names
  /// the manager, or the peer's predecessor; the next one names the peer (takeOverListening).
  void remember(int socket);
  /// Runs `done` once: with true when the process is dead or dying, with false when it lives or was
  /// never known. Within this call wherever proc(5) tells; else after at most `patience_ns`.
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
  pid_t pid_ = 0;  // of the same process, as long as pidfd_ says that it was not replaced
  bool died_already_ = false;
  std::function<void(bool)> done_;
  sd_event_source* death_ = nullptr;
  sd_event_source* patience_ = nullptr;
};

}  // namespace spacekeep::ipc
