#include "ctl/history/entries.h"

#include <fmt/core.h>
#include <pwd.h>

#include <algorithm>

#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl {
namespace {

std::string textAt(const Dictionary& entry, const char* key) {
  const std::string* text = stringAt(entry, key);
  return text == nullptr ? "" : *text;
}

std::optional<HistoryClient> clientOf(const Dictionary& entry) {
  const Value* value = entry.find(keys::kClient);
  const Dictionary* client = value == nullptr ? nullptr : value->dictionary();
  if (client == nullptr) return std::nullopt;
  return HistoryClient{.uid = unsignedAt(*client, keys::kUid),
                       .pid = unsignedAt(*client, keys::kPid),
                       .program = textAt(*client, keys::kProgram),
                       .unit = textAt(*client, keys::kUnit)};
}

std::vector<std::pair<std::string, std::uint64_t>> servicesOf(const Dictionary& entry) {
  std::vector<std::pair<std::string, std::uint64_t>> services;
  const Value* value = entry.find(keys::kReportingServices);
  if (value == nullptr || value->dictionary() == nullptr) return services;
  for (const auto& [service_id, bytes] : *value->dictionary()) {
    if (const auto number = bytes.asUnsigned()) services.emplace_back(service_id, *number);
  }
  std::ranges::stable_sort(services, std::ranges::greater(),
                           &std::pair<std::string, std::uint64_t>::second);
  return services;
}

std::vector<std::string> silentOf(const Dictionary& entry) {
  std::vector<std::string> silent;
  const Value* value = entry.find(keys::kServicesInFlight);
  if (value == nullptr || value->array() == nullptr) return silent;
  for (const Value& service_id : *value->array()) {
    if (service_id.string() != nullptr) silent.push_back(*service_id.string());
  }
  return silent;
}

bool isTooOld(const HistoryEntry& entry, const std::optional<std::int64_t>& since_ns) {
  return since_ns && (!entry.ended || entry.ended->unix_ns < *since_ns);
}

}  // namespace

HistoryEntry historyEntryOf(const Dictionary& entry) {
  const Value* ended = entry.find(keys::kDate);
  const Date* date = ended == nullptr ? nullptr : ended->date();
  const Value* elapsed = entry.find(keys::kElapsedTime);
  return {.number = unsignedAt(entry, keys::kEntry).value_or(0),
          .ended = date == nullptr ? std::nullopt : std::optional(*date),
          .kind = textAt(entry, keys::kKind),
          .client = clientOf(entry),
          .volume = textAt(entry, keys::kVolume),
          .asked_bytes = unsignedAt(entry, keys::kAmount),
          .freed_bytes = unsignedAt(entry, keys::kAmountFreed),
          .reported_bytes = unsignedAt(entry, keys::kAmountReported),
          .free_begin_bytes = unsignedAt(entry, keys::kFreespaceBegin),
          .free_end_bytes = unsignedAt(entry, keys::kFreespaceEnd),
          .urgency = unsignedAt(entry, keys::kUrgency),
          .urgency_limit = unsignedAt(entry, keys::kUrgencyLimit),
          .elapsed_seconds = elapsed == nullptr ? std::nullopt : elapsed->asDouble(),
          .services = servicesOf(entry),
          .other_services_bytes = unsignedAt(entry, keys::kOtherServices),
          .silent = silentOf(entry),
          .why_short = textAt(entry, keys::kWhyShort)};
}

sdk::Result<HistoryList> newestEntries(const HistoryFilter& filter, const AskHistory& ask) {
  HistoryList list;
  // With one more than is wanted it shows whether there are older ones.
  const std::uint64_t page_entries = filter.wanted.since_ns ? kMostOfOnePage : filter.limit + 1;
  auto end =
      forEachEntry(filter.wanted.volume, page_entries, ask, [&](const Dictionary& dictionary) {
        HistoryEntry entry = historyEntryOf(dictionary);
        if (isTooOld(entry, filter.wanted.since_ns)) return true;
        list.older = list.entries.size() == filter.limit;
        if (!list.older) list.entries.push_back(std::move(entry));
        return !list.older;
      });
  if (!end) return end.error();
  list.refused = *end == PagesEnd::kRefused;
  return list;
}

std::string userName(std::uint64_t uid) {
  const auto number = static_cast<uid_t>(uid);
  std::vector<char> buffer(16 * 1024);
  passwd entry{};
  passwd* found = nullptr;
  const bool known = number == uid &&
                     ::getpwuid_r(number, &entry, buffer.data(), buffer.size(), &found) == 0 &&
                     found != nullptr;
  return known ? std::string(entry.pw_name) : fmt::format("uid {}", uid);
}

}  // namespace spacekeep::ctl
