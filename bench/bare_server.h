// Thread safety: one thread runs the server; call it once.
//
// The floor's way to serve: sd-bus and one event loop, nothing else.
#pragma once

#include <sys/stat.h>
#include <systemd/sd-event.h>

#include <cerrno>

#include "bench/sd_bus_handles.h"

namespace bench {

inline constexpr const char* kObject = "/com/quorvel/Spacekeep";
inline constexpr const char* kClientInterface = "com.quorvel.SpacekeepClientProtocol";
inline constexpr const char* kServiceInterface = "com.quorvel.SpacekeepServiceProtocol";

inline int acceptPeer(sd_event_source* source, int fd, uint32_t, void* vtable) {
  const int peer = accept4(fd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
  if (peer < 0) return 0;
  sd_bus* bus = nullptr;
  sd_id128_t id;
  check(sd_id128_randomize(&id), "sd_id128_randomize");
  check(sd_bus_new(&bus), "sd_bus_new");
  check(sd_bus_set_fd(bus, peer, peer), "sd_bus_set_fd");
  check(sd_bus_negotiate_fds(bus, 1), "sd_bus_negotiate_fds");
  check(sd_bus_set_server(bus, 1, id), "sd_bus_set_server");
  check(sd_bus_start(bus), "sd_bus_start");
  check(sd_bus_add_object_vtable(bus, nullptr, kObject, kClientInterface,
                                 static_cast<const sd_bus_vtable*>(vtable), nullptr),
        "vtable");
  check(sd_bus_attach_event(bus, sd_event_source_get_event(source), 0), "attach");
  return 0;  // the bus lives as long as the program
}

inline int listenAt(const char* path) {
  unlink(path);
  const int fd = check(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0), "socket");
  const sockaddr_un address = addressOf(path);
  if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0 ||
      listen(fd, 1024) < 0 || chmod(path, 0666) < 0) {
    check(-errno, path);
  }
  return fd;
}

/// Serves the members of `vtable` to everybody who connects to `path`, until the program is ended.
inline int serve(const char* path, const sd_bus_vtable* vtable) {
  sd_event* event = nullptr;
  check(sd_event_default(&event), "sd_event_default");
  check(sd_event_add_io(event, nullptr, listenAt(path), EPOLLIN, acceptPeer,
                        const_cast<sd_bus_vtable*>(vtable)),
        "sd_event_add_io");
  return sd_event_loop(event);
}

}  // namespace bench
