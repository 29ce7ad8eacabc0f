// Thread safety: every member may be called from any thread but the IPC thread.
//
// What a service sees of the daemon: a socket at which it can check in. Nobody else is served.
#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "sdk/engine.h"
#include "support/ipc/linux/bus_server.h"
#include "support/runtime/guarded.h"

namespace spacekeep::ctl {

struct CheckIn {
  std::string id;
  ipc::SharedDescriptor endpoint;
  Dictionary info;
  pid_t pid = 0;  ///< of the process that called, as the kernel told when it connected
  ipc::Responder responder;
};

class DaemonStandIn {
 public:
  DaemonStandIn(sdk::Engine& engine, std::string socket_path)
      : engine_(engine), socket_path_(std::move(socket_path)) {}
  ~DaemonStandIn() { close(); }
  DaemonStandIn(const DaemonStandIn&) = delete;
  DaemonStandIn& operator=(const DaemonStandIn&) = delete;

  /// Answers what went wrong, empty when it listens.
  [[nodiscard]] std::string open();
  /// As if the daemon's process had ended: every connection closes, nobody listens.
  void close();

  /// The oldest check-in that was not taken yet.
  [[nodiscard]] std::optional<CheckIn> takeCheckIn();
  /// Answers it as the daemon does once the service has answered the ping.
  static void welcome(const CheckIn& check_in);

 private:
  [[nodiscard]] ipc::ServedInterface interface();
  void noteCheckIn(ipc::Arguments in, ipc::Responder responder);

  sdk::Engine& engine_;
  const std::string socket_path_;
  rt::Guarded<std::vector<CheckIn>> waiting_;
  std::unique_ptr<ipc::BusServer> server_;
};

}  // namespace spacekeep::ctl
