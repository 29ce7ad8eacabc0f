#include "support/ipc/served.h"

#include "support/runtime/runtime.h"

namespace spacekeep::ipc {

namespace {

void*& slot() { return rt::threadSlot(rt::ThreadSlot::kCurrentConnection); }

std::size_t timesServed(const ServedInterface& interface, std::string_view name) {
  std::size_t times = 0;
  for (const ServedMethod& method : interface.methods) times += method.name == name ? 1U : 0U;
  return times;
}

std::string problemOf(const ServedInterface& interface, const ServedMethod& method) {
  const std::string name(method.name);
  if (interface.description->having(method.name) == nullptr) return name + " is not described";
  if (!method.serve) return name + " has no handler";
  if (method.mode == ServeMode::kLane && method.lane_width == 0) return name + " has an empty lane";
  return "";
}

}  // namespace

PeerConnection* currentConnection() { return static_cast<PeerConnection*>(slot()); }

ServingScope::ServingScope(PeerConnection* connection) : previous_(slot()) { slot() = connection; }

ServingScope::~ServingScope() { slot() = previous_; }

std::string problemOf(const ServedInterface& interface) {
  if (interface.description == nullptr) return "no description";
  for (const auto* each = interface.description; each != nullptr; each = each->beside) {
    for (const MethodDescription& described : each->methods) {
      const std::size_t times = timesServed(interface, described.name);
      if (times == 0) return std::string(described.name) + " is not served";
      if (times > 1) return std::string(described.name) + " is served twice";
    }
  }
  for (const ServedMethod& method : interface.methods) {
    if (std::string problem = problemOf(interface, method); !problem.empty()) return problem;
  }
  return "";
}

}  // namespace spacekeep::ipc
