// The memory of recent answers, as a query reads and writes it. The record lives in the state
// store; everything here that touches it runs on the daemon's defaults_queue.
#include <utility>
#include <variant>

#include "daemon/spacekeep.h"
#include "operations/info_keys.h"
#include "purgeable/purgeable_operation.h"
#include "support/logging/log.h"
#include "support/runtime/runtime.h"

namespace spacekeep {
namespace {

constexpr double kAgeLimitSeconds = 120.0;
constexpr std::uint64_t kFreespaceThresholdBytes = 5'242'880;
constexpr std::int32_t kNotValidated = 1;

std::shared_ptr<const Dictionary> nothing() {
  static const auto empty = std::make_shared<const Dictionary>();
  return empty;
}

// Only made when it is logged: it spells out the whole record.
Value textForm(const std::shared_ptr<SpacekeepRecentInfo>& record) {
  Dictionary volumes;
  for (const auto& [path, volume] : record->volumes()) volumes.set(path, *record->amounts(path));
  return volumes;
}

}  // namespace

Dictionary SpacekeepPurgeableOperation::cachedInfo(const Dictionary& request) {
  return infoOf(recentAnswers(request, Wanted::kToQueryAsWell));
}

SpacekeepPurgeableOperation::Recent SpacekeepPurgeableOperation::recentAnswers(
    const Dictionary& request, Wanted wanted) {
  Recent recent;
  daemon_->defaults_queue()->sync([&] { recent = readStatistics(request, wanted); });
  return recent;
}

Dictionary SpacekeepPurgeableOperation::infoOf(Recent recent) {
  Dictionary answer;
  answer.set(keys::kServicesToCount, *recent.to_count);
  answer.set(keys::kServicesToQuery, std::move(recent.to_query));
  return answer;
}

void SpacekeepPurgeableOperation::updateServiceStats(const std::string& service_id,
                                                     Dictionary entry) {
  daemon_->defaults_queue()->async([self = self(), service_id, entry = std::move(entry)] {
    self->writeStatistics(service_id, entry);
  });
}

// What the volume's entry knows is counted whatever the validation says, and also for services that
// are not asked in this query.
SpacekeepPurgeableOperation::Recent SpacekeepPurgeableOperation::readStatistics(
    const Dictionary& request, Wanted wanted) {
  const std::string* path = stringAt(request, keys::kVolume);
  const Record record = path == nullptr ? nullptr : storedRecord();
  std::int32_t code = kNotValidated;
  std::shared_ptr<const Dictionary> to_count;
  if (record) {
    code = validate(*record, [this](const std::string& volume) { return freespaceOf(volume); });
    to_count = record->amounts(*path);
  }
  if (!to_count) to_count = nothing();
  logTrace("%s servicesToCount: %@", "cachedInfo", *to_count);
  Array to_query;
  if (wanted == Wanted::kToQueryAsWell) to_query = servicesNotIn(*to_count);
  storeValidated(code, record);
  if (to_query.empty()) {
    logTrace("%s using all cached info", "cachedInfo");
  } else {
    logTrace("%s servicesToQuery: %@", "cachedInfo", Value(to_query));
  }
  return {.to_count = std::move(to_count), .to_query = std::move(to_query)};
}

// Each answer renews the free space and the date of the whole volume, and the record is stored
// after each.
void SpacekeepPurgeableOperation::writeStatistics(const std::string& service_id,
                                                  const Dictionary& entry) {
  Record record = storedRecord();
  if (shouldLogTrace(getLogHandle())) {
    const Value text = record ? textForm(record) : Value("(none)");
    logTrace("%s ^^^ENTRY, serviceID: %@ : %@, recentInfo: %@", "updateServiceStats", service_id,
             entry, text);
  }
  const Value* volume = entry.find(keys::kVolume);
  const Value* amount = entry.find(keys::kAmount);
  if (volume == nullptr || volume->string() == nullptr || amount == nullptr) return;
  if (!record) record = std::make_shared<SpacekeepRecentInfo>();
  const std::string& path = *volume->string();
  const std::uint64_t freespace_bytes = freespaceOf(path);
  record->update(path, service_id, {.amount = *amount, .timestamp = recentDate(rt::wallClockNs())},
                 freespace_bytes);
  // This volume was measured just now.
  static_cast<void>(validate(*record, [&](const std::string& other) {
    return other == path ? freespace_bytes : freespaceOf(other);
  }));
  daemon_->clientSetStateSync(record, memory_key_);
}

SpacekeepPurgeableOperation::Record SpacekeepPurgeableOperation::storedRecord() const {
  const StateObject stored = daemon_->clientGetStateSync(memory_key_);
  const auto* record = std::get_if<Record>(&stored);
  return record == nullptr ? nullptr : *record;
}

void SpacekeepPurgeableOperation::storeValidated(std::int32_t code, const Record& record) {
  if (code == SpacekeepRecentInfo::kInvalid) {
    logTrace("%s Recent Info is invalid, deleting...", "cachedInfo");
    daemon_->clientSetStateSync({}, memory_key_);
  } else if (code == SpacekeepRecentInfo::kChanged) {
    if (shouldLogTrace(getLogHandle())) {
      const Value text = textForm(record);
      logTrace("%s Recent Info need syncing. New values: %@", "cachedInfo", text);
    }
    daemon_->clientSetStateSync(record, memory_key_);
  }
}

std::int32_t SpacekeepPurgeableOperation::validate(SpacekeepRecentInfo& record,
                                                   Freespace freespace) {
  return record.validate(kAgeLimitSeconds, kFreespaceThresholdBytes,
                         {.now = recentDate(rt::wallClockNs()), .freespace = std::move(freespace)});
}

std::uint64_t SpacekeepPurgeableOperation::freespaceOf(const std::string& path) const {
  const Value volume = path;
  return platform().volumes.volumeFreespace(&volume);
}

// Both are in the order of their keys, so one walk over the two finds them.
Array SpacekeepPurgeableOperation::servicesNotIn(const Dictionary& known) const {
  Array missing;
  const auto* next = known.begin();
  for (const auto& entry : services()) {
    while (next != known.end() && next->key < entry.first) ++next;
    if (next == known.end() || next->key != entry.first) missing.emplace_back(entry.first);
  }
  return missing;
}

}  // namespace spacekeep
