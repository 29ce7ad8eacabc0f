// Thread safety: what is marked "IPC thread" only there; the rest from any thread. The last
// reference is given up on the IPC thread.
//
// A connection as a caller: the calls that wait for their answers, and how the connection ends.
#pragma once

#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <string_view>

#include "support/ipc/connection.h"
#include "support/ipc/linux/bus_link.h"
#include "support/ipc/linux/connector.h"
#include "support/ipc/linux/peer_process.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

class ConnectionCore final : public BusLink::Owner,
                             public std::enable_shared_from_this<ConnectionCore> {
 public:
  using SharedErrorHandler = std::shared_ptr<const RemoteProxy::ErrorHandler>;

  ConnectionCore(IpcLoop& loop, ConcurrentQueue& global, SharedDescriptor descriptor,
                 const ConnectionLimits& limits);

  void setInvalidationHandler(Connection::Handler handler);
  void setInterruptionHandler(Connection::Handler handler);
  void setRemoteInterface(const InterfaceDescription& interface);
  void resume();
  void invalidate();
  [[nodiscard]] bool ended() const;
  void call(std::string_view member, Arguments arguments, RemoteProxy::ReplyHandler reply,
            const SharedErrorHandler& on_error);

  /// IPC thread: closes, fails what is pending, runs neither handler.
  void abandon();

  // BusLink::Owner, IPC thread.
  void linkReady() override;
  void linkMessage(sd_bus_message* message) override;
  void linkEnded(LinkEnd end, const std::string& why) override;

 private:
  enum class End { kInvalidation, kInterruption, kSilent };
  struct Call {
    const InterfaceDescription* interface = nullptr;
    const MethodDescription* method = nullptr;
    Arguments arguments;
    RemoteProxy::ReplyHandler reply;
    SharedErrorHandler on_error;
  };

  Error admit(std::string_view member, const Arguments& arguments, Call& call);
  void post(Call call);
  void fail(Call call, Error error);
  void forgetOne();
  [[nodiscard]] bool sendsDescriptors();

  // IPC thread.
  void start(std::deque<Call> held);
  void transmit(Call call);
  Error send(Call& call);
  [[nodiscard]] std::string sizeProblem(const Call& call, std::size_t bytes) const;
  void answered(sd_bus_message* message, Call call);
  void refuse(sd_bus_message* request);
  void failPending(const Error& error);
  void finish(End how);

  const std::shared_ptr<IpcLoop::Inbox> inbox_;
  ConcurrentQueue& global_;
  const ConnectionLimits limits_;

  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  const InterfaceDescription* interface_ = nullptr;
  Connection::Handler on_invalidation_;
  Connection::Handler on_interruption_;
  std::deque<Call> held_;  // until resume()
  std::size_t unanswered_ = 0;
  bool resumed_ = false;
  bool ended_ = false;

  // IPC thread.
  SharedDescriptor descriptor_;  // until the link has it
  BusLink link_;
  PeerProcess peer_;
  std::deque<Call> waiting_;  // until the link is ready
  std::map<std::uint64_t, Call> pending_;
  bool finished_ = false;
};

}  // namespace spacekeep::ipc
