// The floor of a query that asks everybody: takes check-ins as the daemon does, and then asks every
// service in a loop over nothing but sd-bus. Usage: bench-bare-asker SOCKET
//
// clientPurgeableSpace waits for each answer before it asks the next service;
// clientItemizedPurgeableSpace asks all of them first and then collects the answers.
#include <fcntl.h>

#include <cerrno>
#include <map>
#include <string>

#include "bench/bare_server.h"

namespace {

struct Asked {
  sd_bus* bus = nullptr;
  bool answered = false;
  uint64_t amount = 0;
};
std::map<std::string, Asked> services;

int takeCheckIn(sd_bus_message* message, void*, sd_bus_error*) {
  const char* id = nullptr;
  int endpoint = -1;
  bench::check(sd_bus_message_read(message, "sh", &id, &endpoint), "check-in");
  const int fd = bench::check(fcntl(endpoint, F_DUPFD_CLOEXEC, 3), "dup");
  sd_bus* bus = nullptr;
  bench::check(sd_bus_new(&bus), "sd_bus_new");
  bench::check(sd_bus_set_fd(bus, fd, fd), "sd_bus_set_fd");
  bench::check(sd_bus_start(bus), "sd_bus_start");
  services[id].bus = bus;
  return sd_bus_reply_method_return(message, "aa{sv}as", 1, 0, 0);
}

bench::Message requestTo(sd_bus* bus) {
  sd_bus_message* raw = nullptr;
  bench::check(sd_bus_message_new_method_call(bus, &raw, nullptr, bench::kObject,
                                              bench::kServiceInterface, "servicePurgeable"),
               "new call");
  bench::Message request(raw);
  bench::check(sd_bus_message_append(raw, "ia{sv}", 3, 2, "SPACEKEEP_URGENCY", "i", 3,
                                     "SPACEKEEP_VOLUME", "s", "/volumes/disk"),
               "append");
  return request;
}

uint64_t amountIn(sd_bus_message* answer) {
  uint64_t amount = 0;
  bench::check(sd_bus_message_enter_container(answer, 'a', "a{sv}"), "enter");
  bench::check(sd_bus_message_enter_container(answer, 'a', "{sv}"), "enter");
  while (bench::check(sd_bus_message_enter_container(answer, 'e', "sv"), "enter") > 0) {
    const char* key = nullptr;
    bench::check(sd_bus_message_read(answer, "s", &key), "key");
    const bool wanted = std::strcmp(key, "SPACEKEEP_AMOUNT") == 0;
    bench::check(
        wanted ? sd_bus_message_read(answer, "v", "t", &amount) : sd_bus_message_skip(answer, "v"),
        "value");
    bench::check(sd_bus_message_exit_container(answer), "exit");
  }
  return amount;
}

void askAndWait(Asked& service) {
  const bench::Message request = requestTo(service.bus);
  sd_bus_message* raw = nullptr;
  bench::check(sd_bus_call(service.bus, request.get(), 0, nullptr, &raw), "servicePurgeable");
  const bench::Message answer(raw);
  service.amount = amountIn(raw);
  service.answered = true;
}

int takeAnswer(sd_bus_message* message, void* asked, sd_bus_error*) {
  auto* service = static_cast<Asked*>(asked);
  if (sd_bus_message_is_method_error(message, nullptr) > 0) bench::check(-EREMOTEIO, "answer");
  service->amount = amountIn(message);
  service->answered = true;
  return 1;
}

void askAllThenWait() {
  for (auto& [id, service] : services) {
    service.answered = false;
    const bench::Message request = requestTo(service.bus);
    bench::check(
        sd_bus_call_async(service.bus, nullptr, request.get(), takeAnswer, &service, UINT64_MAX),
        "call");
  }
  for (auto& [id, service] : services) {
    while (!service.answered) {
      if (bench::check(sd_bus_process(service.bus, nullptr), "process") > 0) continue;
      bench::check(sd_bus_wait(service.bus, UINT64_MAX), "wait");
    }
  }
}

int replyWithAnswers(sd_bus_message* call) {
  sd_bus_message* raw = nullptr;
  bench::check(sd_bus_message_new_method_return(call, &raw), "new return");
  const bench::Message reply(raw);
  int64_t total = 0;
  bench::check(sd_bus_message_open_container(raw, 'a', "a{sv}"), "open");
  bench::check(sd_bus_message_open_container(raw, 'a', "{sv}"), "open");
  for (const auto& [id, service] : services) {
    if (!service.answered) continue;
    bench::check(sd_bus_message_append(raw, "{sv}", id.c_str(), "t", service.amount), "append");
    total += static_cast<int64_t>(service.amount);
  }
  bench::check(sd_bus_message_append(raw, "{sv}", "SPACEKEEP_TOTAL_AVAILABLE", "x", total), "x");
  bench::check(sd_bus_message_append(raw, "{sv}", "SPACEKEEP_VOLUME", "s", "/volumes/disk"), "v");
  bench::check(sd_bus_message_close_container(raw), "close");
  bench::check(sd_bus_message_close_container(raw), "close");
  return sd_bus_send(nullptr, raw, nullptr);
}

int queryOneByOne(sd_bus_message* message, void*, sd_bus_error*) {
  for (auto& [id, service] : services) askAndWait(service);
  return replyWithAnswers(message);
}

int queryAllAtOnce(sd_bus_message* message, void*, sd_bus_error*) {
  askAllThenWait();
  return replyWithAnswers(message);
}

const sd_bus_vtable kVtable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("clientCheckin", "sha{sv}", "aa{sv}as", takeCheckIn, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("clientPurgeableSpace", "a{sv}", "aa{sv}", queryOneByOne,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("clientItemizedPurgeableSpace", "a{sv}", "aa{sv}", queryAllAtOnce,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

}  // namespace

int main(int count, char** arguments) {
  return count == 2 ? bench::serve(arguments[1], kVtable) : 2;
}
