#include "support/ipc/linux/bus_listener.h"

#include <utility>

namespace spacekeep::ipc {

BusListener::BusListener(IpcLoop& loop, ConcurrentQueue& global, Access& access,
                         SharedDescriptor listening, ServedInterface interface,
                         ServerOptions options)
    : loop_(loop),
      global_(global),
      access_(access),
      listening_(std::move(listening)),
      interface_(std::move(interface)),
      options_(std::move(options)) {}

BusListener::~BusListener() = default;

void BusListener::setRequiredEntitlement(std::string entitlement) {
  required_entitlement_ = std::move(entitlement);
}

void BusListener::resume() {
  if (server_ != nullptr) return;
  ServerOptions options = options_;
  options.admit = [this, also = options_.admit](PeerConnection& peer, std::string& why) {
    if (!required_entitlement_.empty() &&
        !access_.connectionIsEntitled(&peer, {required_entitlement_})) {
      why = "it does not hold \"" + required_entitlement_ + "\"";
      return false;
    }
    return !also || also(peer, why);
  };
  server_ = std::make_unique<BusServer>(loop_, global_, interface_, std::move(options));
  server_->serveListening(listening_);
  if (options_.bus) server_->serveOnBus(*options_.bus);
}

std::size_t BusListener::connections() const {
  return server_ == nullptr ? 0 : server_->connections();
}

}  // namespace spacekeep::ipc
