// Thread safety: run() is for the host's supervising thread.
//
// Serves a service at a listening socket that was handed to the process.
#pragma once

#include <spacekeep/service.h>

#include <sys/types.h>

#include <memory>
#include <optional>

#include "sdk/engine.h"
#include "sdk/host_control.h"
#include "sdk/served_service.h"
#include "support/ipc/arguments.h"

namespace spacekeep::sdk {

/// The socket to serve at: the given one, else the service manager's.
[[nodiscard]] Result<ipc::SharedDescriptor> listeningSocket(const SocketOptions& options);

/// Whether a peer of that uid may call the service: root, the service's own user and the allowed one.
[[nodiscard]] bool mayCall(uid_t peer, uid_t own, std::optional<uid_t> allowed);

class SocketLoop {
 public:
  SocketLoop(ipc::SharedDescriptor listening, SocketOptions options, Engine& engine,
             std::shared_ptr<HostControl> control, std::shared_ptr<ServedService> served);

  /// Until the control is told to stop, or nothing was asked for too long.
  void run();

 private:
  void waitForIdleness();

  const ipc::SharedDescriptor listening_;
  const SocketOptions options_;
  Engine& engine_;
  const std::shared_ptr<HostControl> control_;
  const std::shared_ptr<ServedService> served_;
};

}  // namespace spacekeep::sdk
