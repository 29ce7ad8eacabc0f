// Thread safety: plain functions; each bus belongs to the thread that uses it.
//
// The calls that the benchmark clients time, and what they do with the times.
#pragma once

#include <algorithm>
#include <ctime>
#include <vector>

#include "bench/bare_server.h"

namespace bench {

inline double nowUs() {
  timespec now = {};
  clock_gettime(CLOCK_MONOTONIC, &now);
  return static_cast<double>(now.tv_sec) * 1e6 + static_cast<double>(now.tv_nsec) / 1e3;
}

inline Message newCall(sd_bus* bus, const char* member) {
  sd_bus_message* raw = nullptr;
  check(sd_bus_message_new_method_call(bus, &raw, nullptr, kObject, kClientInterface, member),
        "new call");
  return Message(raw);
}

inline Message callAndWait(sd_bus* bus, sd_bus_message* call, const char* member) {
  sd_bus_error error = {};
  sd_bus_message* reply = nullptr;
  const int result = sd_bus_call(bus, call, 0, &error, &reply);
  if (result < 0 && error.message != nullptr) std::fprintf(stderr, "%s\n", error.message);
  sd_bus_error_free(&error);
  check(result, member);
  return Message(reply);
}

inline Message cancelNothing(sd_bus* bus) {
  const Message call = newCall(bus, "clientCancelPurge");
  check(sd_bus_message_append(call.get(), "a{sv}", 1, "SPACEKEEP_TOKEN", "s", "none"), "append");
  return callAndWait(bus, call.get(), "clientCancelPurge");
}

inline Message getState(sd_bus* bus, const char* key) {
  const Message call = newCall(bus, "clientGetState");
  check(sd_bus_message_append(call.get(), "s", key), "append");
  return callAndWait(bus, call.get(), "clientGetState");
}

/// `text` null removes the key.
inline void setState(sd_bus* bus, const char* key, const char* text) {
  const Message call = newCall(bus, "clientSetState");
  if (text == nullptr) {
    check(sd_bus_message_append(call.get(), "av", 0), "append");
  } else {
    check(sd_bus_message_append(call.get(), "av", 1, "s", text), "append");
  }
  check(sd_bus_message_append(call.get(), "s", key), "append");
  callAndWait(bus, call.get(), "clientSetState");
}

inline Message query(sd_bus* bus, const char* member = "clientPurgeableSpace") {
  const Message call = newCall(bus, member);
  check(sd_bus_message_append(call.get(), "a{sv}", 2, "SPACEKEEP_URGENCY", "i", 3,
                              "SPACEKEEP_VOLUME", "s", "/volumes/disk"),
        "append");
  return callAndWait(bus, call.get(), member);
}

/// Entries of the dictionary in a query's answer; 0 when there is none.
inline int entriesIn(sd_bus_message* answer) {
  int entries = 0;
  check(sd_bus_message_enter_container(answer, 'a', "a{sv}"), "enter");
  if (check(sd_bus_message_at_end(answer, 0), "at end") > 0) return 0;
  check(sd_bus_message_enter_container(answer, 'a', "{sv}"), "enter");
  while (check(sd_bus_message_at_end(answer, 0), "at end") == 0) {
    check(sd_bus_message_skip(answer, "{sv}"), "skip");
    ++entries;
  }
  return entries;
}

inline double percentile(std::vector<double> values, double share) {
  if (values.empty()) return 0;
  std::sort(values.begin(), values.end());
  return values[static_cast<std::size_t>(share * static_cast<double>(values.size() - 1))];
}

}  // namespace bench
