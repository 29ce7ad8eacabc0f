// Thread safety: confined to the test that made it.
//
// A simulated service with one connection to it, and what comes back over that.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <utility>

#include "registry/service_protocol.h"
#include "sim/world/world.h"

namespace spacekeep::sim {

inline constexpr std::uint64_t kSecond = 1'000'000'000;

/// A service on a volume, a connection to it, and what came back.
struct Line {
  explicit Line(ServiceBehaviour behaviour) : service(world.addService("cache", behaviour)) {
    world.volumes().add("/", 10'000, 100);
    connection = world.connector().connectionFromEndpoint(world.endpointOf(service));
    connection->setRemoteInterface(spacekeepServiceInterface());
    connection->setInvalidationHandler([this] { invalidated.signal(); });
    connection->setInterruptionHandler([this] { interrupted.signal(); });
    proxy = connection->remoteProxy([this](const ipc::Error&) { failed.signal(); });
    connection->resume();
  }
  ~Line() { world.shutDown(); }
  Line(const Line&) = delete;
  Line& operator=(const Line&) = delete;

  void purge(std::uint64_t bytes, std::int32_t urgency = 1, const char* token = "t") {
    SpacekeepServiceProtocol(proxy).servicePurge(
        urgency,
        {{"SPACEKEEP_VOLUME", "/"}, {"SPACEKEEP_AMOUNT", bytes}, {"SPACEKEEP_TOKEN", token}},
        [this](ipc::OptionalDictionary reply) {
          answer = std::move(reply);
          replied.signal();
        });
  }
  [[nodiscard]] std::optional<std::uint64_t> answeredAmount() const {
    return answer ? unsignedAt(*answer, "SPACEKEEP_AMOUNT") : std::nullopt;
  }

  World world;
  std::shared_ptr<SimulatedService> service;
  std::shared_ptr<ipc::Connection> connection;
  std::shared_ptr<ipc::RemoteProxy> proxy;
  CountingSemaphore replied{0};
  CountingSemaphore failed{0};
  CountingSemaphore invalidated{0};
  CountingSemaphore interrupted{0};
  ipc::OptionalDictionary answer;
};

inline bool comes(CountingSemaphore& semaphore) {
  return semaphore.waitForNs(1000 * kSecond) == WaitResult::kSignalled;
}

inline ServiceBehaviour owning(std::uint64_t bytes, CallBehaviour call) {
  ServiceBehaviour behaviour = ownsBytes("/", bytes);
  behaviour.purge = {call};
  return behaviour;
}

}  // namespace spacekeep::sim
