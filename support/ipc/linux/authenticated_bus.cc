#include "support/ipc/linux/authenticated_bus.h"

#include <fcntl.h>
#include <sys/socket.h>
#include <systemd/sd-bus.h>
#include <systemd/sd-id128.h>
#include <unistd.h>

#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "support/files/linux/descriptor.h"
#include "support/ipc/linux/sockets.h"

namespace spacekeep::ipc {

namespace {

/// Takes over both descriptors: the bus closes them, and without a bus nobody has them any more.
sd_bus* startServer(FileDescriptor input, FileDescriptor output, BusDescriptors descriptors) {
  sd_bus* bus = nullptr;
  if (sd_bus_new(&bus) < 0) return nullptr;
  // Nobody ever sees it.
  constexpr sd_id128_t kId{
      {'S', 'p', 'a', 'c', 'e', 'k', 'e', 'e', 'p', ' ', 's', 'e', 'r', 'v', 'e', 'r'}};
  const int takes_descriptors = descriptors == BusDescriptors::kTaken ? 1 : 0;
  const bool prepared =
      sd_bus_set_bus_client(bus, 0) >= 0 && sd_bus_negotiate_fds(bus, takes_descriptors) >= 0 &&
      sd_bus_set_server(bus, 1, kId) >= 0 && sd_bus_set_method_call_timeout(bus, UINT64_MAX) >= 0 &&
      sd_bus_set_exit_on_disconnect(bus, 0) >= 0 &&
      sd_bus_set_fd(bus, input.get(), output.get()) >= 0;
  if (prepared) {
    static_cast<void>(input.release());
    static_cast<void>(output.release());
    if (sd_bus_start(bus) >= 0) return bus;
  }
  sd_bus_close_unref(bus);
  return nullptr;
}

std::string ownHandshake() {
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text(1, '\0');
  text += "AUTH EXTERNAL ";
  for (const char c : std::to_string(::geteuid())) {
    text += kDigits[static_cast<unsigned char>(c) / 16];
    text += kDigits[static_cast<unsigned char>(c) % 16];
  }
  return text + "\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

bool passHandshake(sd_bus* bus, int other_end) {
  const std::string text = ownHandshake();
  if (::send(other_end, text.data(), text.size(), MSG_NOSIGNAL) !=
      static_cast<ssize_t>(text.size())) {
    return false;
  }
  constexpr int kMoreThanEnoughSteps = 16;
  for (int i = 0; i < kMoreThanEnoughSteps; ++i) {
    if (sd_bus_is_ready(bus) > 0) return true;
    if (sd_bus_process(bus, nullptr) < 0) return false;
  }
  return false;
}

/// Above those that every program expects to have.
FileDescriptor duplicateOf(int descriptor) {
  return FileDescriptor(::fcntl(descriptor, F_DUPFD_CLOEXEC, 3));
}

}  // namespace

AuthenticatedBus makeAuthenticatedBus(int socket, BusDescriptors descriptors) {
  const SocketPair pair = makeSocketPair();
  if (pair.first == nullptr) return {};
  FileDescriptor input = duplicateOf(pair.first->fd());
  FileDescriptor output = duplicateOf(pair.first->fd());
  if (!input.valid() || !output.valid()) return {};
  AuthenticatedBus made{.input = input.get(), .output = output.get()};
  made.bus = startServer(std::move(input), std::move(output), descriptors);
  if (made.bus == nullptr) return {};
  if (passHandshake(made.bus, pair.second->fd()) && ::dup3(socket, made.input, O_CLOEXEC) >= 0 &&
      ::dup3(socket, made.output, O_CLOEXEC) >= 0) {
    return made;
  }
  sd_bus_close_unref(made.bus);
  return {};
}

}  // namespace spacekeep::ipc
