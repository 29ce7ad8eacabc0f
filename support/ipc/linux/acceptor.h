// Thread safety: confined to the IPC thread.
//
// Accepts connections of a listening socket. Running out of descriptors makes it pause, since the
// socket stays readable and it would spin.
#pragma once

#include <cstdint>
#include <functional>

#include "support/ipc/arguments.h"
#include "support/ipc/linux/ipc_loop.h"

namespace spacekeep::ipc {

class Acceptor {
 public:
  using OnConnection = std::function<void(SharedDescriptor)>;

  Acceptor(IpcLoop& loop, SharedDescriptor listening, std::uint64_t pause_ns,
           OnConnection on_connection);
  ~Acceptor();
  Acceptor(const Acceptor&) = delete;
  Acceptor& operator=(const Acceptor&) = delete;

  /// False when the event loop takes no further source.
  bool start();

 private:
  static int onReadable(sd_event_source*, int fd, std::uint32_t events, void* self);
  static int onPauseEnd(sd_event_source*, std::uint64_t usec, void* self);
  void acceptSome();
  void pause(std::uint64_t duration_ns);

  IpcLoop& loop_;
  const SharedDescriptor listening_;
  const std::uint64_t pause_ns_;
  const OnConnection on_connection_;
  sd_event_source* readable_ = nullptr;
  sd_event_source* pause_ = nullptr;
};

}  // namespace spacekeep::ipc
