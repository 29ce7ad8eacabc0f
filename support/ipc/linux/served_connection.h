// Thread safety: confined to the IPC thread; other threads may hold weak references.
//
// One accepted connection, whose peer's calls are served.
#pragma once

#include <cstddef>
#include <functional>
#include <memory>
#include <string>

#include "support/ipc/linux/bus_link.h"
#include "support/ipc/linux/call_server.h"

namespace spacekeep::ipc {

class ServedConnection final : public BusLink::Owner, public CallServer {
 public:
  /// `on_end` runs once, when the connection has ended by itself.
  ServedConnection(std::shared_ptr<ServerContext> context, std::shared_ptr<AcceptedPeer> peer,
                   std::function<void()> on_end);

  void start(int fd);
  void close() { link_.close(); }

  void linkReady() override {}
  bool linkMayRead() override;
  void linkMessage(sd_bus_message* message) override;
  void linkEnded(LinkEnd end, const std::string& why) override;

 private:
  sd_bus* bus() override { return link_.ended() ? nullptr : link_.bus(); }
  void send(sd_bus_message* message, std::size_t bytes) override { link_.send(message, bytes); }

  std::function<void()> on_end_;
  BusLink link_;
};

}  // namespace spacekeep::ipc
