// Thread safety: used by one test at a time.
//
// A daemon with services that take part in the daily pass.
#pragma once

#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "operations/periodic_operation.h"
#include "tests/both/daemon/daemon_world.h"

namespace spacekeep::test {

inline constexpr std::uint64_t kSecond = 1'000'000'000;

struct PeriodicWorld : DaemonWorld {
  /// A service of these roles that says it freed `amount`, `delay_ns` after it was asked.
  std::shared_ptr<sim::SimulatedService> add(const std::string& id, std::uint64_t amount,
                                             std::uint64_t delay_ns, Array roles = Array{"PURGE"}) {
    return add(id, amount, sim::CallBehaviour{.delay_ns = delay_ns}, std::move(roles));
  }
  std::shared_ptr<sim::SimulatedService> add(const std::string& id, std::uint64_t amount,
                                             sim::CallBehaviour periodic,
                                             Array roles = Array{"PURGE"}) {
    sim::ServiceBehaviour behaviour;
    behaviour.periodic = periodic;
    behaviour.periodic_amount = amount;
    return world.declareService(id, std::move(behaviour),
                                {{"SPACEKEEP_SERVICES", std::move(roles)}});
  }

  [[nodiscard]] std::shared_ptr<SpacekeepPeriodicOperation> make(Dictionary info = {}) {
    if (!info.contains(keys::kVolume)) info.set(keys::kVolume, "/");
    return makeOperation<SpacekeepPeriodicOperation>(platform, std::move(info),
                                                     *daemon->copyServices());
  }

  /// Runs it to its end. The completion must have run once by then.
  static Dictionary run(SpacekeepPeriodicOperation& operation) {
    const auto outcomes = std::make_shared<rt::Guarded<std::vector<Dictionary>>>();
    operation.startOperation([outcomes](const Dictionary& outcome) {
      outcomes->update([&](std::vector<Dictionary>& list) { list.push_back(outcome); });
    });
    EXPECT_EQ(outcomes->get().size(), 1U);
    return outcomes->get().empty() ? Dictionary() : outcomes->get().front();
  }
};

inline Dictionary amountOf(std::uint64_t bytes) { return {{keys::kAmount, bytes}}; }

}  // namespace spacekeep::test
