// Talking to services outside of the operations: pings and notifications.
#include <atomic>
#include <utility>

#include "daemon/spacekeep.h"
#include "support/logging/log.h"
#include "support/queues/waiting.h"

namespace spacekeep {
namespace {

// Marks the line in the log from which a notification was sent.
constexpr int kSendingLine = 155;

}  // namespace

bool Spacekeep::pingService(const SpacekeepServiceProtocol& proxy) {
  struct Ping {
    CountingSemaphore answered{0};
    std::atomic<bool> pong = false;
  };
  const auto ping = std::make_shared<Ping>();
  logTrace("%s calling servicePing", "pingService");
  proxy.servicePing([ping] {
    logTrace("%s ping got pong", "pingService");
    ping->pong = true;
    ping->answered.signal();
  });
  ping->answered.wait();
  return ping->pong;
}

void Spacekeep::notifyRecipients(std::string name, ipc::OptionalValue value) {
  logTrace("%s name: %@, value: %@", "notifyRecipients", name, value ? &*value : nullptr);
  notify_queue_->async(
      [self = shared_from_this(), recipients = copyServices(), name = std::move(name),
       value = std::move(value)] { self->deliverNotification(*recipients, name, value); });
}

void Spacekeep::deliverNotification(const ServiceMap& recipients, const std::string& name,
                                    const ipc::OptionalValue& value) const {
  Dictionary notification;
  if (value) notification.set(name, *value);
  for (const auto& [service_id, service] : recipients) {
    if (!service->desires(name)) continue;
    platform_.services.CallServiceAsync(
        service,
        [service_id = service_id, notification](std::shared_ptr<ipc::RemoteProxy> proxy,
                                                ServiceCaller::Done done) {
          logTrace("%s %d serviceID: %@", "notifyRecipients", kSendingLine, service_id);
          SpacekeepServiceProtocol(std::move(proxy)).serviceNotify(notification, std::move(done));
        },
        [] { logTrace("%s connection invalidated", "notifyRecipients"); });
  }
}

}  // namespace spacekeep
