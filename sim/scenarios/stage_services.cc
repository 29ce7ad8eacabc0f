#include "sim/scenarios/stage_services.h"

#include <utility>

namespace spacekeep::sim {

void StageServices::add(const SystemService& plan, const std::map<std::string, OwnedBytes>& owns) {
  ServiceBehaviour behaviour = plan.behaviour;
  behaviour.owns = owns;
  services_[plan.id] = plan.descriptor
                           ? world_.declareService(plan.id, std::move(behaviour), *plan.descriptor)
                           : world_.addService(plan.id, std::move(behaviour));
  plans_[plan.id] = plan;
  orders_[plan.id] = SerialQueue::create("service " + plan.id, world_.global());
}

void StageServices::start(const std::function<void()>& done) {
  for (const auto& [id, plan] : plans_) {
    if (plan.descriptor) {
      done();
      continue;
    }
    world_.after(plan.check_in_after_ns, [this, &plan = plan, done] {
      inOrder(plan.id, [this, &plan, done] {
        checkIn(plan.id, plan.check_in_info);
        done();
      });
    });
  }
}

void StageServices::act(const ServiceAction& action, const std::function<void()>& done) {
  if (!services_.contains(action.service)) return done();
  inOrder(action.service, [this, action, done] {
    perform(action);
    done();
  });
}

void StageServices::inOrder(const std::string& id, Task task) {
  orders_.at(id)->async(std::move(task));
}

void StageServices::perform(const ServiceAction& action) {
  const std::shared_ptr<SimulatedService>& service = services_.at(action.service);
  const SystemService& plan = plans_.at(action.service);
  switch (action.kind) {
    case ServiceAction::Kind::kDies:
      if (service->alive()) service->die();
      return;
    case ServiceAction::Kind::kCloses:
      if (service->alive()) service->closeConnections();
      return;
    case ServiceAction::Kind::kStarts:
      if (service->alive()) return;
      service->start();
      if (!plan.descriptor) checkIn(plan.id, plan.check_in_info);
      return;
    case ServiceAction::Kind::kChecksIn:
      checkIn(plan.id, action.info);
      return;
    case ServiceAction::Kind::kRegrows:
      service->grow(action.volume, action.urgency, action.bytes);
      return;
    case ServiceAction::Kind::kIntrudes: {
      const auto stranger = world_.client("stranger");
      called_(world_.call(stranger, "clientCheckin",
                          {plan.id, world_.endpointOf(service), action.info}));
      return;
    }
  }
}

// A dead process calls nobody.
void StageServices::checkIn(const std::string& id, const Dictionary& info) {
  const std::shared_ptr<SimulatedService>& service = services_.at(id);
  if (!service->alive()) return;
  const auto call = world_.checkIn(service, info);
  called_(call);
  if (!pings_may_be_silent_) (void)call->wait();
}

}  // namespace spacekeep::sim
