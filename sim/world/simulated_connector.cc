#include "sim/world/simulated_connector.h"
#include "support/runtime/locks.h"

#include <utility>

namespace spacekeep::sim {
namespace {

constexpr int kFirstEndpoint = -1000;

}  // namespace

ipc::SharedDescriptor SimulatedConnector::endpointOf(std::shared_ptr<SimulatedService> service) {
  const std::scoped_lock lock(mutex_);
  const int endpoint = kFirstEndpoint - static_cast<int>(endpoints_.size());
  endpoints_.emplace(endpoint, std::move(service));
  return std::make_shared<ipc::Descriptor>(endpoint);
}

void SimulatedConnector::declare(std::shared_ptr<SimulatedService> service) {
  const std::scoped_lock lock(mutex_);
  const std::string id = service->id();
  declared_[id] = std::move(service);
}

void SimulatedConnector::undeclare(const std::string& service_id) {
  const std::scoped_lock lock(mutex_);
  declared_.erase(service_id);
  to_declared_.erase(service_id);
}

std::shared_ptr<ipc::Connection> SimulatedConnector::connectionFromEndpoint(
    ipc::SharedDescriptor endpoint) {
  std::shared_ptr<SimulatedService> service;
  {
    const std::scoped_lock lock(mutex_);
    const auto found = endpoint == nullptr ? endpoints_.end() : endpoints_.find(endpoint->fd());
    if (found != endpoints_.end()) service = found->second;
  }
  return makeConnection(std::move(service));
}

std::shared_ptr<ipc::Connection> SimulatedConnector::connectionToDeclared(
    const std::string& service_id, const ipc::InterfaceDescription& interface) {
  std::shared_ptr<SimulatedService> service;
  {
    const std::scoped_lock lock(mutex_);
    const auto open = to_declared_.find(service_id);
    if (open != to_declared_.end() && !open->second->ended()) return open->second;
    const auto found = declared_.find(service_id);
    if (found == declared_.end() || !found->second->alive()) return nullptr;
    service = found->second;
  }
  const auto connection = makeConnection(std::move(service));
  connection->setRemoteInterface(interface);
  connection->resume();
  const std::scoped_lock lock(mutex_);
  to_declared_[service_id] = connection;
  return connection;
}

std::shared_ptr<SimulatedConnection> SimulatedConnector::makeConnection(
    std::shared_ptr<SimulatedService> service) {
  const auto connection = std::make_shared<SimulatedConnection>(global_, service);
  if (service != nullptr) service->connected(connection);
  bool abandoned = false;
  {
    const std::scoped_lock lock(mutex_);
    made_.push_back(connection);
    abandoned = abandoned_;
  }
  if (abandoned) connection->abandon();
  return connection;
}

std::size_t SimulatedConnector::connectionsMade() const {
  const std::scoped_lock lock(mutex_);
  return made_.size();
}

void SimulatedConnector::abandon() {
  std::map<std::string, std::shared_ptr<SimulatedConnection>> to_declared;
  std::vector<std::weak_ptr<SimulatedConnection>> made;
  {
    const std::scoped_lock lock(mutex_);
    abandoned_ = true;
    to_declared.swap(to_declared_);
    made.swap(made_);
    endpoints_.clear();
    declared_.clear();
  }
  for (const auto& weak : made) {
    if (const auto connection = weak.lock()) connection->abandon();
  }
}

}  // namespace spacekeep::sim
