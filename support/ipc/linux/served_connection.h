// Thread safety: confined to the IPC thread; other threads may hold weak references.
//
// One accepted connection: finds the method of a call, decodes its arguments, has it served on the
// global queue, and sends the answer.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>

#include "support/ipc/linux/bus_link.h"
#include "support/ipc/linux/server_context.h"
#include "support/queues/serial_queue.h"

namespace spacekeep::ipc {

class ServedConnection final : public BusLink::Owner,
                               public std::enable_shared_from_this<ServedConnection> {
 public:
  /// `on_end` runs once, when the connection has ended by itself.
  ServedConnection(std::shared_ptr<ServerContext> context, std::shared_ptr<AcceptedPeer> peer,
                   std::function<void()> on_end);

  void start(int fd);
  void close() { link_.close(); }
  [[nodiscard]] const access::PeerIdentity& identity() const { return peer_->identity(); }

  /// Ends the call of that serial. An absent answer only makes room for another call.
  void answer(std::uint64_t serial, const MethodDescription& method, const Arguments& arguments);
  void fail(std::uint64_t serial, const Error& error);
  void forgetCall() { --unanswered_; }

  void linkReady() override {}
  bool linkMayRead() override;
  void linkMessage(sd_bus_message* message) override;
  void linkEnded(LinkEnd end, const std::string& why) override;

 private:
  void dispatch(sd_bus_message* call);
  void dispatchStandard(sd_bus_message* call, const std::string& interface,
                        const std::string& member);
  void dispatchServed(sd_bus_message* call, const std::string& member);
  void serve(sd_bus_message* call, const MethodDescription& method);
  void run(const ServedMethod& method, std::size_t bytes, Task task);
  void schedule(const ServedMethod& method, Task task);
  void sendText(sd_bus_message* call, const std::string& text);
  void sendEmpty(sd_bus_message* call);
  void refuse(sd_bus_message* call, const char* error_name, const std::string& text);
  bool sendError(sd_bus_message* call, const char* error_name, const std::string& text);

  const std::shared_ptr<ServerContext> context_;
  const std::shared_ptr<AcceptedPeer> peer_;
  std::function<void()> on_end_;
  BusLink link_;
  std::shared_ptr<SerialQueue> in_order_;  // made for the first call that needs it
  std::size_t unanswered_ = 0;
};

}  // namespace spacekeep::ipc
