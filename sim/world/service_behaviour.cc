#include "sim/world/service_behaviour.h"

namespace spacekeep::sim {

ServiceBehaviour ownsBytes(const std::string& volume, std::uint64_t bytes) {
  ServiceBehaviour behaviour;
  behaviour.owns[volume] = OwnedBytes{0, bytes, 0, 0, 0};
  return behaviour;
}

}  // namespace spacekeep::sim
