// The floor: a peer that serves the same members as the daemon with nothing but sd-bus and one
// event loop. Usage: bench-bare-peer SOCKET
#include <systemd/sd-event.h>

#include <cerrno>

#include "bench/sd_bus_handles.h"

namespace {

int answerEmpty(sd_bus_message* message, void*, sd_bus_error*) {
  bench::check(sd_bus_message_skip(message, "a{sv}"), "skip");
  return sd_bus_reply_method_return(message, nullptr);
}

const sd_bus_vtable kVtable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("clientCancelPurge", "a{sv}", "", answerEmpty, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

int accepted(sd_event_source* source, int fd, uint32_t, void*) {
  const int peer = accept4(fd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
  if (peer < 0) return 0;
  sd_bus* bus = nullptr;
  sd_id128_t id;
  bench::check(sd_id128_randomize(&id), "sd_id128_randomize");
  bench::check(sd_bus_new(&bus), "sd_bus_new");
  bench::check(sd_bus_set_fd(bus, peer, peer), "sd_bus_set_fd");
  bench::check(sd_bus_set_server(bus, 1, id), "sd_bus_set_server");
  bench::check(sd_bus_start(bus), "sd_bus_start");
  bench::check(sd_bus_add_object_vtable(bus, nullptr, "/com/quorvel/Spacekeep",
                                        "com.quorvel.SpacekeepClientProtocol", kVtable, nullptr),
               "vtable");
  bench::check(sd_bus_attach_event(bus, sd_event_source_get_event(source), 0), "attach");
  return 0;  // the bus lives as long as the program
}

}  // namespace

int main(int count, char** arguments) {
  if (count != 2) return 2;
  const char* path = arguments[1];
  unlink(path);
  const int fd =
      bench::check(socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0), "socket");
  const sockaddr_un address = bench::addressOf(path);
  if (bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) < 0 ||
      listen(fd, 64) < 0) {
    bench::check(-errno, path);
  }
  sd_event* event = nullptr;
  bench::check(sd_event_default(&event), "sd_event_default");
  bench::check(sd_event_add_io(event, nullptr, fd, EPOLLIN, accepted, nullptr), "sd_event_add_io");
  return sd_event_loop(event);
}
