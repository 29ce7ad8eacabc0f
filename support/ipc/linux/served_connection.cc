#include "support/ipc/linux/served_connection.h"

#include <systemd/sd-bus.h>

#include <utility>

namespace spacekeep::ipc {

namespace {

LinkLimits linkLimits(const ServerLimits& limits) {
  return {limits.authentication_ns, limits.message_bytes, limits.queued_messages,
          limits.queued_bytes};
}

}  // namespace

ServedConnection::ServedConnection(std::shared_ptr<ServerContext> context,
                                   std::shared_ptr<AcceptedPeer> peer, std::function<void()> on_end)
    : CallServer(std::move(context), std::move(peer)),
      on_end_(std::move(on_end)),
      link_(CallServer::context().loop, *this, Authentication::Role::kServer,
            linkLimits(CallServer::context().options.limits)) {}

void ServedConnection::start(int fd) { link_.start(fd, identity().uid()); }

void ServedConnection::linkEnded(LinkEnd end, const std::string& why) {
  if (end == LinkEnd::kRefused) context().refusals.write(identity().describe(), why);
  if (const auto on_end = std::exchange(on_end_, nullptr)) on_end();
}

bool ServedConnection::linkMayRead() {
  const uid_t uid = identity().uid();
  if (context().pace.mayGoOn(uid)) return true;
  context().pace.wait(uid, [weak = weak_from_this()] {
    if (const auto self = weak.lock()) static_cast<ServedConnection&>(*self).link_.resumeReading();
  });
  return false;
}

void ServedConnection::linkMessage(sd_bus_message* message) {
  context().pace.spendOnMessage(identity().uid(), link_.messageBytes());
  // Answers and signals are of no interest here: nothing is ever asked over this connection.
  if (sd_bus_message_is_method_call(message, nullptr, nullptr) > 0) {
    dispatch(message, link_.messageBytes());
  }
}

}  // namespace spacekeep::ipc
