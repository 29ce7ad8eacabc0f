// Thread safety: every member may be called from any thread once all services have been added.
//
// The services of one life, with what the plan does to them. What happens to one service happens in
// order: it dies only after its check-ins have been answered, unless a ping may stay silent.
#pragma once

#include <functional>
#include <map>
#include <memory>
#include <string>
#include <utility>

#include "sim/scenarios/system_scenario.h"
#include "sim/world/world.h"
#include "support/queues/serial_queue.h"

namespace spacekeep::sim {

class StageServices {
 public:
  /// `called` is told of each check-in.
  StageServices(World& world, bool pings_may_be_silent,
                std::function<void(const std::shared_ptr<ClientCall>&)> called)
      : world_(world), pings_may_be_silent_(pings_may_be_silent), called_(std::move(called)) {}

  /// `owns` is what is left of its data.
  void add(const SystemService& plan, const std::map<std::string, OwnedBytes>& owns);
  /// Lets those that are not declared check in, and calls `done` for each that has been added.
  void start(const std::function<void()>& done);
  /// Calls `done` when it has happened, also when there is no such service.
  void act(const ServiceAction& action, const std::function<void()>& done);

  [[nodiscard]] const std::map<std::string, std::shared_ptr<SimulatedService>>& all() const {
    return services_;
  }

 private:
  void inOrder(const std::string& id, Task task);
  void perform(const ServiceAction& action);
  void checkIn(const std::string& id, const Dictionary& info);

  World& world_;
  const bool pings_may_be_silent_;
  const std::function<void(const std::shared_ptr<ClientCall>&)> called_;
  std::map<std::string, SystemService> plans_;
  std::map<std::string, std::shared_ptr<SimulatedService>> services_;
  std::map<std::string, std::shared_ptr<SerialQueue>> orders_;
};

}  // namespace spacekeep::sim
