// Thread safety: plain helpers; each handle belongs to the thread that uses its bus.
//
// The few lines of sd-bus that the benchmark programs share.
#pragma once

#include <sys/socket.h>
#include <sys/un.h>
#include <systemd/sd-bus.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <memory>

namespace bench {

struct UnrefMessage {
  void operator()(sd_bus_message* message) const { sd_bus_message_unref(message); }
};
using Message = std::unique_ptr<sd_bus_message, UnrefMessage>;

struct CloseBus {
  void operator()(sd_bus* bus) const { sd_bus_flush_close_unref(bus); }
};
using Bus = std::unique_ptr<sd_bus, CloseBus>;

/// Ends the program when `result` is a negative errno value.
inline int check(int result, const char* what) {
  if (result < 0) {
    std::fprintf(stderr, "%s: %s\n", what, std::strerror(-result));
    std::exit(1);
  }
  return result;
}

inline sockaddr_un addressOf(const char* path) {
  sockaddr_un address = {};
  address.sun_family = AF_UNIX;
  std::snprintf(address.sun_path, sizeof address.sun_path, "%s", path);
  return address;
}

/// A client bus on a connected unix stream socket, without a bus daemon.
inline Bus connectBus(const char* path) {
  const int fd = check(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0), "socket");
  const sockaddr_un address = addressOf(path);
  if (connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0) {
    check(-errno, path);
  }
  sd_bus* bus = nullptr;
  check(sd_bus_new(&bus), "sd_bus_new");
  check(sd_bus_set_fd(bus, fd, fd), "sd_bus_set_fd");
  check(sd_bus_start(bus), "sd_bus_start");
  return Bus(bus);
}

}  // namespace bench
