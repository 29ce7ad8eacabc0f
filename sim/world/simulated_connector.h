// Thread safety: every member may be called from any thread.
//
// Finds the simulated service behind an endpoint or a declared ID. Endpoints are negative numbers,
// which are never descriptors of the process.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "sim/world/simulated_connection.h"
#include "support/ipc/connection.h"
#include "support/runtime/runtime.h"

namespace spacekeep::sim {

class SimulatedConnector final : public ipc::Connector {
 public:
  explicit SimulatedConnector(ConcurrentQueue& global) : global_(global) {}

  /// An endpoint that leads to the service, to be passed at check-in.
  [[nodiscard]] ipc::SharedDescriptor endpointOf(std::shared_ptr<SimulatedService> service);
  /// The service can be reached under its ID from now on.
  void declare(std::shared_ptr<SimulatedService> service);
  void undeclare(const std::string& service_id);
  /// Abandons every connection, also those still to come.
  void abandon();

  [[nodiscard]] std::shared_ptr<ipc::Connection> connectionFromEndpoint(
      ipc::SharedDescriptor endpoint) override;
  [[nodiscard]] std::shared_ptr<ipc::Connection> connectionToDeclared(
      const std::string& service_id, const ipc::InterfaceDescription& interface) override;

  [[nodiscard]] std::size_t connectionsMade() const;

 private:
  [[nodiscard]] std::shared_ptr<SimulatedConnection> makeConnection(
      std::shared_ptr<SimulatedService> service);

  ConcurrentQueue& global_;
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  std::map<int, std::shared_ptr<SimulatedService>> endpoints_;
  std::map<std::string, std::shared_ptr<SimulatedService>> declared_;
  std::map<std::string, std::shared_ptr<SimulatedConnection>> to_declared_;
  std::vector<std::weak_ptr<SimulatedConnection>> made_;
  bool abandoned_ = false;
};

}  // namespace spacekeep::sim
