// Calls a method over a message bus as fast as it goes, until it is killed.
//
//   bus-flooder SOCKET NAME PATH INTERFACE MEMBER
//
// The method takes a 32-bit number. Writes "flooding" once the first call is answered.
#include <systemd/sd-bus.h>

#include <cstdint>
#include <cstdio>
#include <string>

namespace {

// dbus-daemon lets 128 answers be owed to one connection.
constexpr unsigned kUnanswered = 120;

unsigned unanswered = 0;
bool is_first = true;

int answered(sd_bus_message*, void*, sd_bus_error*) {
  --unanswered;
  if (is_first) {
    is_first = false;
    std::puts("flooding");
    std::fflush(stdout);
  }
  return 0;
}

sd_bus* connectTo(const std::string& socket) {
  sd_bus* bus = nullptr;
  if (sd_bus_new(&bus) < 0 || sd_bus_set_address(bus, ("unix:path=" + socket).c_str()) < 0 ||
      sd_bus_set_bus_client(bus, 1) < 0 || sd_bus_start(bus) < 0) {
    return nullptr;
  }
  return bus;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc != 6) return 2;
  sd_bus* bus = connectTo(argv[1]);
  if (bus == nullptr) return 1;
  for (std::int32_t number = 0;; ++number) {
    while (unanswered < kUnanswered) {
      if (sd_bus_call_method_async(bus, nullptr, argv[2], argv[3], argv[4], argv[5], answered,
                                   nullptr, "i", number) < 0) {
        return 1;
      }
      ++unanswered;
    }
    int progress = 0;
    while ((progress = sd_bus_process(bus, nullptr)) > 0) {
    }
    if (progress < 0) return 1;
    if (unanswered >= kUnanswered) sd_bus_wait(bus, UINT64_MAX);
  }
}
