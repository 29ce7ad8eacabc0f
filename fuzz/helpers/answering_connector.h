// Thread safety: every member may be called from any fiber of one schedule.
//
// Services of a simulated world that answer whatever the input says: any dictionary, none, an error,
// late or never. Space comes back now and then.
#pragma once

#include <memory>
#include <string>
#include <vector>

#include "fuzz/helpers/value_maker.h"
#include "sim/world/world.h"
#include "support/ipc/connection.h"

namespace spacekeep::fuzz {

class AnsweringConnector final : public ipc::Connector {
 public:
  AnsweringConnector(sim::World& world, ValueMaker& input) : world_(world), input_(input) {}

  std::shared_ptr<ipc::Connection> connectionFromEndpoint(ipc::SharedDescriptor endpoint) override;
  std::shared_ptr<ipc::Connection> connectionToDeclared(
      const std::string& service_id, const ipc::InterfaceDescription& interface) override;

  /// One call, on its way to the service.
  void receive(const ipc::MethodDescription& method, ipc::RemoteProxy::ReplyHandler reply,
               ipc::RemoteProxy::ErrorHandler on_error);
  /// Lets go of the calls that were never answered.
  void forget() { unanswered_.clear(); }

 private:
  [[nodiscard]] ipc::Arguments answer(const ipc::MethodDescription& method);

  sim::World& world_;
  ValueMaker& input_;
  std::vector<ipc::RemoteProxy::ReplyHandler> unanswered_;
};

}  // namespace spacekeep::fuzz
