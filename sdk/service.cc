#include <spacekeep/service.h>

namespace spacekeep::sdk {

Answer Service::purgeable(const Job& /*job*/) { return {}; }
Answer Service::purge(const Job& /*job*/) { return {}; }
Answer Service::periodic(const Job& /*job*/) { return {}; }
void Service::notify(const std::string& /*name*/, const Value& /*value*/) {}
std::optional<Dictionary> Service::callback(const Dictionary& /*info*/) { return std::nullopt; }
void Service::cancelRequested() {}
void Service::pinged() {}

const char* textOf(HostState state) {
  switch (state) {
    case HostState::kConnecting:
      return "connecting";
    case HostState::kCheckingIn:
      return "checking in";
    case HostState::kServing:
      return "serving";
    case HostState::kRefused:
      return "refused";
    case HostState::kWaiting:
      return "waiting";
    case HostState::kStopped:
      return "stopped";
  }
  return "";
}

}  // namespace spacekeep::sdk
