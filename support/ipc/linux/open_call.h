// Thread safety: every member may be called from any thread.
//
// A call that was taken in and not answered yet. The first answer counts; dropped without one, it
// only makes room for another call of its connection. What it takes up of its user's budget is given
// back when nobody holds it any more.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>

#include "support/ipc/linux/call_server.h"
#include "support/ipc/linux/server_context.h"

namespace spacekeep::ipc {

class OpenCall {
 public:
  OpenCall(std::shared_ptr<ServerContext> context, std::weak_ptr<CallServer> connection,
           const MethodDescription& method, std::uint64_t serial, bool wants_answer,
           std::optional<uid_t> turn_of, std::shared_ptr<void> room);
  ~OpenCall();
  OpenCall(const OpenCall&) = delete;
  OpenCall& operator=(const OpenCall&) = delete;

  /// What a handler gets; it keeps `call` alive.
  [[nodiscard]] static Responder responderFor(const std::shared_ptr<OpenCall>& call);

 private:
  void reply(Arguments arguments);
  void fail(const Error& error);
  template <class Act>
  void finish(Act act);

  const std::shared_ptr<ServerContext> context_;
  const std::weak_ptr<CallServer> connection_;
  const MethodDescription& method_;
  const std::uint64_t serial_;
  const bool wants_answer_;
  const std::optional<uid_t> turn_of_;  ///< the user whose turn ends with this call
  const std::shared_ptr<void> room_;    ///< of the user's budget, may be null
  std::atomic<bool> finished_{false};
};

}  // namespace spacekeep::ipc
