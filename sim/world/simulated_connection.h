// Thread safety: every member may be called from any thread.
//
// A connection to a simulated service, in process. Calls reach the service in the order in which
// they were made; replies and handlers run on the global queue, side by side.
#pragma once

#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "sim/world/simulated_service.h"
#include "support/ipc/connection.h"
#include "support/queues/serial_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class SimulatedConnection final : public ipc::Connection,
                                  public std::enable_shared_from_this<SimulatedConnection> {
 public:
  /// Without a service the connection ends as soon as it is resumed.
  SimulatedConnection(ConcurrentQueue& global, std::shared_ptr<SimulatedService> service);

  void setInvalidationHandler(Handler handler) override;
  void setInterruptionHandler(Handler handler) override;
  void setRemoteInterface(const ipc::InterfaceDescription& interface) override;
  void resume() override;
  [[nodiscard]] std::shared_ptr<ipc::RemoteProxy> remoteProxy(
      ipc::RemoteProxy::ErrorHandler on_error) override;
  void invalidate() override;

  /// From the peer's side, or by the wire: pending calls fail, the fitting handler runs.
  void end(ConnectionEnd how);
  [[nodiscard]] bool ended() const override;
  /// Drops every handler and pending call without running it, but answers the pings that never got
  /// an answer, and every later one: the daemon waits for those without a limit, and the world has
  /// to come to an end.
  void abandon();

 private:
  class Proxy;
  struct PendingCall {
    std::string member;
    ipc::Arguments arguments;
    ipc::RemoteProxy::ReplyHandler reply;
    ipc::RemoteProxy::ErrorHandler on_error;
  };

  void call(std::string_view member, ipc::Arguments arguments, ipc::RemoteProxy::ReplyHandler reply,
            ipc::RemoteProxy::ErrorHandler on_error);
  void send(std::uint64_t call);
  void deliver(std::uint64_t call);
  void replied(std::uint64_t call, ipc::Arguments answer);
  void failCall(std::uint64_t call, const char* name, std::string text);
  void keepPing(ipc::RemoteProxy::ReplyHandler reply);  // with mutex_ held
  void post(const ipc::RemoteProxy::ErrorHandler& on_error, ipc::Error error);

  ConcurrentQueue& global_;
  const std::shared_ptr<SimulatedService> service_;
  const std::shared_ptr<SerialQueue> wire_;  // keeps the order of calls
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  const ipc::InterfaceDescription* interface_ = nullptr;
  Handler on_invalidation_;
  Handler on_interruption_;
  std::map<std::uint64_t, PendingCall> pending_;
  std::deque<std::uint64_t> held_;  // made before resume()
  std::uint64_t last_call_ = 0;
  bool resumed_ = false;
  bool ended_ = false;
  bool abandoned_ = false;
  std::vector<ipc::RemoteProxy::ReplyHandler> lost_pings_;
};

}  // namespace spacekeep::sim
