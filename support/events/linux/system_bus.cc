#include "support/events/linux/system_bus.h"

#include <fcntl.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cerrno>
#include <memory>

namespace spacekeep {
namespace {

constexpr std::uint64_t kAnswerWithinUsec = 3'000'000;

struct CloseBus {
  void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};
struct UnrefMessage {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Bus = std::unique_ptr<sd_bus, CloseBus>;

/// Null with errno set when there is no bus.
Bus connectTo(const std::string& socket) {
  if (::access(socket.c_str(), F_OK) < 0) return nullptr;
  sd_bus* made = nullptr;
  int result = sd_bus_new(&made);
  Bus bus(made);
  if (result >= 0) result = sd_bus_set_address(bus.get(), ("unix:path=" + socket).c_str());
  if (result >= 0) result = sd_bus_set_bus_client(bus.get(), 1);
  if (result >= 0) result = sd_bus_set_method_call_timeout(bus.get(), kAnswerWithinUsec);
  if (result >= 0) result = sd_bus_start(bus.get());
  if (result >= 0) return bus;
  errno = -result;
  return nullptr;
}

}  // namespace

int emitSystemSignal(const std::string& bus_socket, const std::string& name) {
  const std::size_t dot = name.rfind('.');
  if (dot == std::string::npos) return EINVAL;
  const Bus bus = connectTo(bus_socket);
  if (bus == nullptr) return errno;
  const int sent = sd_bus_emit_signal(bus.get(), ipc::kObjectPath, name.substr(0, dot).c_str(),
                                      name.substr(dot + 1).c_str(), nullptr);
  if (sent < 0) return -sent;
  const int flushed = sd_bus_flush(bus.get());  // waits until the bus has greeted us and has it
  return flushed < 0 ? -flushed : 0;
}

ipc::SharedDescriptor inhibitSleep(const std::string& bus_socket, const std::string& why) {
  const Bus bus = connectTo(bus_socket);
  if (bus == nullptr) return nullptr;
  sd_bus_message* answer = nullptr;
  const int called =
      sd_bus_call_method(bus.get(), "org.freedesktop.login1", "/org/freedesktop/login1",
                         "org.freedesktop.login1.Manager", "Inhibit", nullptr, &answer, "ssss",
                         "sleep", "Spacekeep", why.c_str(), "block");
  const std::unique_ptr<sd_bus_message, UnrefMessage> answered(answer);
  int fd = -1;
  if (called < 0 || sd_bus_message_read(answered.get(), "h", &fd) <= 0) return nullptr;
  const int kept = ::fcntl(fd, F_DUPFD_CLOEXEC, 3);  // the message closes its own
  return kept < 0 ? nullptr : std::make_shared<ipc::Descriptor>(kept);
}

}  // namespace spacekeep
