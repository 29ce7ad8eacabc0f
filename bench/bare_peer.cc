// The floor: a peer that answers the same members as the daemon, with the same content, with
// nothing but sd-bus and one event loop. Usage: bench-bare-peer SOCKET [QUERY_ANSWERS]
#include <string>
#include <utility>
#include <vector>

#include "bench/bare_server.h"

namespace {

constexpr const char* kStateValue = "twenty bytes of text";
constexpr int kUsers = 5;

// What a query is answered with: service IDs as bench-many-services makes them, and amounts.
std::vector<std::pair<std::string, uint64_t>> answers;

int answerEmpty(sd_bus_message* message, void*, sd_bus_error*) {
  bench::check(sd_bus_message_skip(message, "a{sv}"), "skip");
  return sd_bus_reply_method_return(message, nullptr);
}

int answerState(sd_bus_message* message, void*, sd_bus_error*) {
  const char* key = nullptr;
  bench::check(sd_bus_message_read(message, "s", &key), "key");
  return sd_bus_reply_method_return(message, "av", 1, "s", kStateValue);
}

void writeAnswers(sd_bus_message* reply, const char* volume) {
  int64_t total = 0;
  bench::check(sd_bus_message_open_container(reply, 'a', "a{sv}"), "open");
  bench::check(sd_bus_message_open_container(reply, 'a', "{sv}"), "open");
  for (const auto& [id, amount] : answers) {
    bench::check(sd_bus_message_append(reply, "{sv}", id.c_str(), "t", amount), "append");
    total += static_cast<int64_t>(amount);
  }
  bench::check(sd_bus_message_append(reply, "{sv}", "SPACEKEEP_TOTAL_AVAILABLE", "x", total),
               "append");
  bench::check(sd_bus_message_append(reply, "{sv}", "SPACEKEEP_VOLUME", "s", volume), "append");
  bench::check(sd_bus_message_close_container(reply), "close");
  bench::check(sd_bus_message_close_container(reply), "close");
}

int answerQuery(sd_bus_message* message, void*, sd_bus_error*) {
  bench::check(sd_bus_message_skip(message, "a{sv}"), "skip");
  sd_bus_message* raw = nullptr;
  bench::check(sd_bus_message_new_method_return(message, &raw), "new return");
  const bench::Message reply(raw);
  writeAnswers(raw, "/volumes/disk");
  return sd_bus_send(nullptr, raw, nullptr);
}

const sd_bus_vtable kVtable[] = {
    SD_BUS_VTABLE_START(0),
    SD_BUS_METHOD("clientCancelPurge", "a{sv}", "", answerEmpty, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("clientGetState", "s", "av", answerState, SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_METHOD("clientPurgeableSpace", "a{sv}", "aa{sv}", answerQuery,
                  SD_BUS_VTABLE_UNPRIVILEGED),
    SD_BUS_VTABLE_END,
};

}  // namespace

int main(int count, char** arguments) {
  if (count < 2) return 2;
  const int known = count > 2 ? std::atoi(arguments[2]) : 0;
  for (int i = 0; i < known; ++i) {
    answers.emplace_back("user" + std::to_string(i % kUsers + 1) + "-" + std::to_string(i / kUsers),
                         1'048'576);
  }
  return bench::serve(arguments[1], kVtable);
}
