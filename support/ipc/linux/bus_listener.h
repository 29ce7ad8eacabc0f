// Thread safety: as Listener: set-up from one thread, then any thread.
//
// The daemon's listener: accepts connections on a listening unix socket from peers that hold the
// required entitlement, and serves the daemon's interface on them.
#pragma once

#include <memory>
#include <string>

#include "support/access/access.h"
#include "support/ipc/linux/bus_server.h"
#include "support/ipc/served.h"

namespace spacekeep::ipc {

class BusListener : public Listener {
 public:
  /// Nothing is accepted before resume(); the kernel holds early connections in its backlog.
  BusListener(IpcLoop& loop, ConcurrentQueue& global, Access& access, SharedDescriptor listening,
              ServedInterface interface, ServerOptions options = {});
  ~BusListener() override;

  void setRequiredEntitlement(std::string entitlement) override;
  void resume() override;
  /// Connections that are open, those still authenticating included.
  [[nodiscard]] std::size_t connections() const;

 private:
  IpcLoop& loop_;
  ConcurrentQueue& global_;
  Access& access_;
  SharedDescriptor listening_;
  ServedInterface interface_;
  ServerOptions options_;
  std::string required_entitlement_;
  std::unique_ptr<BusServer> server_;
};

}  // namespace spacekeep::ipc
