// The history as one object for programs.
#include <utility>

#include "ctl/history/table.h"
#include "ctl/json_text.h"

namespace spacekeep::ctl {
namespace {

void setNumber(Dictionary& object, const char* key, const std::optional<std::uint64_t>& number) {
  if (number) object.set(key, *number);
}

void setText(Dictionary& object, const char* key, const std::string& text) {
  if (!text.empty()) object.set(key, text);
}

Value valueOf(const HistoryClient& client, const HistoryWords& words) {
  Dictionary object;
  setNumber(object, "uid", client.uid);
  if (client.uid) object.set("user", words.user(*client.uid));
  setNumber(object, "pid", client.pid);
  setText(object, "program", client.program);
  setText(object, "unit", client.unit);
  return object;
}

void setServices(Dictionary& object, const HistoryEntry& entry) {
  Array services;
  for (const auto& [service_id, bytes] : entry.services) {
    services.emplace_back(Dictionary{{"id", service_id}, {"bytes", bytes}});
  }
  Array silent(entry.silent.begin(), entry.silent.end());
  object.set("services", std::move(services));
  setNumber(object, "other_services_bytes", entry.other_services_bytes);
  object.set("silent_services", std::move(silent));
}

}  // namespace

Value jsonMembersOf(const HistoryEntry& entry, const HistoryWords& words) {
  Dictionary object{{"number", entry.number}, {"kind", entry.kind}};
  if (entry.ended) object.set("ended", *entry.ended);
  if (entry.client) object.set("client", valueOf(*entry.client, words));
  setText(object, "volume", entry.volume);
  setNumber(object, "asked_bytes", entry.asked_bytes);
  setNumber(object, "freed_bytes", entry.freed_bytes);
  setNumber(object, "reported_bytes", entry.reported_bytes);
  setNumber(object, "free_begin_bytes", entry.free_begin_bytes);
  setNumber(object, "free_end_bytes", entry.free_end_bytes);
  setNumber(object, "urgency", entry.urgency);
  setNumber(object, "urgency_limit", entry.urgency_limit);
  if (entry.elapsed_seconds) object.set("elapsed_seconds", *entry.elapsed_seconds);
  setServices(object, entry);
  setText(object, "why_short", entry.why_short);
  return object;
}

std::string jsonOf(const HistoryList& list, const HistoryWords& words) {
  Array entries;
  for (const HistoryEntry& entry : list.entries) entries.push_back(jsonMembersOf(entry, words));
  return jsonOf(Value(Dictionary{{"entries", std::move(entries)}, {"older", list.older}}));
}

}  // namespace spacekeep::ctl
