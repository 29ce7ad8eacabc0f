// Services that make themselves known at run time, and the lifetime of their connections.
#include <string>
#include <utility>

#include "client/entitlements.h"
#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "support/logging/log.h"

namespace spacekeep {

struct Spacekeep::CheckIn {
  std::string service_id;
  ipc::SharedDescriptor endpoint;
  Dictionary info;
  CheckinReply reply;
};

void Spacekeep::clientCheckin(std::string service_id, ipc::SharedDescriptor endpoint,
                              Dictionary info, CheckinReply reply) {
  bool is_declared = false;
  daemons_queue_->sync([&] { is_declared = daemons_.contains(service_id); });
  if (is_declared) {
    reply(std::nullopt, std::nullopt);
    return;
  }
  // A caller without the right is not answered at all: the reply is dropped.
  if (!connectionIsEntitled(entitlements::kService)) {
    logProblem("%s Connection is not entitled!", "clientCheckin");
    return;
  }
  CheckIn check_in{std::move(service_id), std::move(endpoint), std::move(info), std::move(reply)};
  collection_queue_->async([self = shared_from_this(), check_in = std::move(check_in)] {
    self->registerService(check_in);
  });
}

bool Spacekeep::connectionIsEntitled(std::string_view entitlement) const {
  return platform_.access.connectionIsEntitled(ipc::currentConnection(), {entitlement});
}

void Spacekeep::registerService(const CheckIn& check_in) {
  std::shared_ptr<SKService> service = registry_.find(check_in.service_id);
  const std::string why = service ? std::string() : refusalOf(check_in);
  if (!why.empty()) {
    logProblem("%s refusing %@, %@", "clientCheckin",
               check_in.service_id.substr(0, kMaxServiceIdBytes), why);
    check_in.reply(std::nullopt, why);
    return;
  }
  if (service) {
    logTrace("%s operating on an existing service", "clientCheckin");
  } else {
    service = openService(check_in);
  }
  service->setDoesPeriodic(truthAt(check_in.info, keys::kRolePeriodic));
  service->setDoesPurge(truthAt(check_in.info, keys::kRolePurge));
  const Value* names = check_in.info.find(keys::kNotifications);
  service->setDesiredNotifications(names ? std::optional<Value>(*names) : std::nullopt);
  check_in.reply(Dictionary{{keys::kServiceId, check_in.service_id}, {keys::kAnonymous, true}},
                 std::nullopt);
}

/// Why no service can be made of it, empty when one can. Nobody stands behind a useless endpoint to
/// answer the ping, and the ping is waited for without a limit.
std::string Spacekeep::refusalOf(const CheckIn& check_in) const {
  const std::size_t registered = registry_.services().size();
  if (registered >= kMaxRegisteredServices) {
    return std::to_string(registered) + " services are registered, try again later";
  }
  if (check_in.service_id.size() > kMaxServiceIdBytes) {
    return "its ID has " + std::to_string(check_in.service_id.size()) + " bytes, more than " +
           std::to_string(kMaxServiceIdBytes);
  }
  if (check_in.endpoint && !check_in.endpoint->problem().empty()) {
    return "its endpoint cannot be used: " + check_in.endpoint->problem();
  }
  return "";
}

// Waits until the service answers a ping, and with it everybody who needs collection_queue. A
// service that stays silent holds the registry; that order is relied upon and kept.
std::shared_ptr<SKService> Spacekeep::openService(const CheckIn& check_in) {
  auto service = std::make_shared<SKService>(check_in.service_id);
  service->setEndpoint(check_in.endpoint);
  service->connection = platform_.connector.connectionFromEndpoint(check_in.endpoint);
  registry_.set(check_in.service_id, service);
  ipc::Connection& connection = *service->connection;
  const auto removal = removalHandler(service);
  connection.setInvalidationHandler([removal] {
    logTrace("%s invalidationHandler ENTRY", "clientCheckin");
    removal();
  });
  connection.setInterruptionHandler([removal] {
    logTrace("%s interruptionHandler ENTRY", "clientCheckin");
    removal();
  });
  connection.setRemoteInterface(spacekeepServiceInterface());
  const auto proxy = connection.remoteProxy([service](const ipc::Error& error) {
    logTrace("%s failed to get the remote proxy: %@", "clientCheckin",
             error.name + ": " + error.text);
    service->connection->invalidate();
  });
  connection.resume();
  static_cast<void>(pingService(SpacekeepServiceProtocol(proxy)));
  return service;
}

// The weak reference keeps a handler from keeping a removed record alive, and from removing a newer
// record under the same ID.
std::function<void()> Spacekeep::removalHandler(const std::shared_ptr<SKService>& service) {
  return [weak_daemon = weak_from_this(), service_id = service->ID,
          weak_service = std::weak_ptr<SKService>(service)] {
    const auto daemon = weak_daemon.lock();
    if (!daemon) return;
    daemon->collection_queue_->async([daemon, service_id, weak_service] {
      const auto ended = weak_service.lock();
      if (!ended || daemon->registry_.find(service_id) != ended) return;
      daemon->registry_.remove(service_id);
    });
  };
}

}  // namespace spacekeep
