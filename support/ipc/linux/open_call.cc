#include "support/ipc/linux/open_call.h"

#include <utility>

namespace spacekeep::ipc {

OpenCall::OpenCall(std::shared_ptr<ServerContext> context, std::weak_ptr<CallServer> connection,
                   const MethodDescription& method, std::uint64_t serial, bool wants_answer,
                   std::optional<uid_t> turn_of, std::shared_ptr<void> room)
    : context_(std::move(context)),
      connection_(std::move(connection)),
      method_(method),
      serial_(serial),
      wants_answer_(wants_answer),
      turn_of_(turn_of),
      room_(std::move(room)) {}

OpenCall::~OpenCall() {
  finish([](CallServer&) {});
}

Responder OpenCall::responderFor(const std::shared_ptr<OpenCall>& call) {
  return {[call](Arguments arguments) { call->reply(std::move(arguments)); },
          [call](const Error& error) { call->fail(error); }};
}

/// Runs `act` on the IPC thread if the connection is still there, the first time only. The gate
/// keeps the loop from being used after the server, and with it perhaps the loop, has gone.
template <class Act>
void OpenCall::finish(Act act) {
  if (finished_.exchange(true)) return;
  const GatePass pass(context_->gate);
  if (!pass.inside()) return;
  context_->loop.post(
      [context = context_, turn_of = turn_of_, connection = connection_, act = std::move(act)] {
        if (turn_of) context->turns.end(*turn_of);
        const auto alive = connection.lock();
        if (alive == nullptr) return;
        alive->forgetCall();
        act(*alive);
      });
}

void OpenCall::reply(Arguments arguments) {
  finish([serial = serial_, method = &method_, wanted = wants_answer_,
          arguments = std::move(arguments)](CallServer& connection) {
    if (wanted) connection.answer(serial, *method, arguments);
  });
}

void OpenCall::fail(const Error& error) {
  finish([serial = serial_, wanted = wants_answer_, error](CallServer& connection) {
    if (wanted) connection.fail(serial, error);
  });
}

}  // namespace spacekeep::ipc
