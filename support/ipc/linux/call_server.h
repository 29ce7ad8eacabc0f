// Thread safety: confined to the IPC thread; other threads may hold weak references.
//
// Serves the calls of one peer: finds the method of a call, decodes its arguments, has it served on
// the global queue, and sends the answer. How messages come and go is for those who derive from it.
#pragma once

#include <systemd/sd-bus.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

#include "support/ipc/linux/server_context.h"
#include "support/queues/serial_queue.h"

namespace spacekeep::ipc {

class CallServer : public std::enable_shared_from_this<CallServer> {
 public:
  CallServer(std::shared_ptr<ServerContext> context, std::shared_ptr<AcceptedPeer> peer)
      : context_(std::move(context)), peer_(std::move(peer)) {}
  virtual ~CallServer() = default;
  CallServer(const CallServer&) = delete;
  CallServer& operator=(const CallServer&) = delete;

  [[nodiscard]] const access::PeerIdentity& identity() const { return peer_->identity(); }
  /// Calls that were taken in and not answered yet.
  [[nodiscard]] std::size_t unanswered() const { return unanswered_; }

  /// Ends the call of that serial. An absent answer only makes room for another call.
  void answer(std::uint64_t serial, const MethodDescription& method, const Arguments& arguments);
  void fail(std::uint64_t serial, const Error& error);
  void forgetCall() { --unanswered_; }

 protected:
  /// `bytes`: the size of the message.
  void dispatch(sd_bus_message* call, std::size_t bytes);
  /// For a call that wants an answer: answers it with an error.
  void refuse(sd_bus_message* call, const char* error_name, const std::string& text);
  [[nodiscard]] ServerContext& context() const { return *context_; }
  /// Why the peer is not to be served at all, empty when it is.
  [[nodiscard]] std::string admissionRefusal() { return context_->admissionRefusal(*peer_); }

 private:
  /// For making messages; null once nothing can be sent any more.
  [[nodiscard]] virtual sd_bus* bus() = 0;
  /// Sends or queues it; `bytes` is its estimated size.
  virtual void send(sd_bus_message* message, std::size_t bytes) = 0;
  /// Why an answer of that size cannot be sent now, empty when it can.
  [[nodiscard]] virtual std::string answerProblem(std::size_t) const { return ""; }
  /// A peer of ours takes no larger answer than this side takes calls, and ends the connection.
  [[nodiscard]] std::string sizeProblem(std::size_t bytes) const;
  /// Why the method is not for these peers, empty when it is.
  [[nodiscard]] virtual std::string methodProblem(const MethodDescription&) const { return ""; }
  /// Whom answers go to, null where there is only one.
  [[nodiscard]] virtual const char* destination() const { return nullptr; }

  void dispatchStandard(sd_bus_message* call, const std::string& interface,
                        const std::string& member);
  void dispatchServed(sd_bus_message* call, const InterfaceDescription& interface,
                      const std::string& member, std::size_t bytes);
  void serve(sd_bus_message* call, const MethodDescription& method, std::size_t bytes);
  /// What the call takes up until it is gone, null when that is not counted; also null, with the
  /// reason in `why`, when the call has to be refused.
  std::shared_ptr<void> roomFor(const ServedMethod& served, const MethodDescription& method,
                                std::size_t bytes, std::string& why);
  void run(const ServedMethod& method, std::size_t bytes, Task task);
  void schedule(const ServedMethod& method, Task task);
  void sendText(sd_bus_message* call, const std::string& text);
  void sendEmpty(sd_bus_message* call);
  void sendError(sd_bus_message* call, const char* error_name, const std::string& text);

  const std::shared_ptr<ServerContext> context_;
  const std::shared_ptr<AcceptedPeer> peer_;
  std::shared_ptr<SerialQueue> in_order_;  // made for the first call that needs it
  std::size_t unanswered_ = 0;
};

}  // namespace spacekeep::ipc
