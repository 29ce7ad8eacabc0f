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

Dictionary amountsOf(const SpacekeepRecentVolumeInfo& volume) {
  Dictionary amounts;
  for (const auto& [service_id, service] : volume.services) {
    amounts.set(service_id, service.amount);
  }
  return amounts;
}

// Only made when it is logged: it spells out the whole record.
Value textForm(const std::shared_ptr<SpacekeepRecentInfo>& record) {
  Dictionary volumes;
  for (const auto& [path, volume] : record->volumes()) volumes.set(path, amountsOf(volume));
  return volumes;
}

}  // namespace

Dictionary SpacekeepPurgeableOperation::cachedInfo(const Dictionary& request) {
  Dictionary answer;
  daemon_->defaults_queue()->sync([&] { answer = readStatistics(request); });
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
Dictionary SpacekeepPurgeableOperation::readStatistics(const Dictionary& request) {
  const std::string* path = stringAt(request, keys::kVolume);
  const Record record = path == nullptr ? nullptr : storedRecord();
  const std::int32_t code = record ? validate(*record) : kNotValidated;
  Dictionary to_count;
  if (record) {
    if (const auto* entry = record->volume(*path)) to_count = amountsOf(*entry);
  }
  logTrace("%s servicesToCount: %@", "cachedInfo", to_count);
  Array to_query = servicesNotIn(to_count);
  storeValidated(code, record);
  if (to_query.empty()) {
    logTrace("%s using all cached info", "cachedInfo");
  } else {
    logTrace("%s servicesToQuery: %@", "cachedInfo", Value(to_query));
  }
  Dictionary answer;
  answer.set(keys::kServicesToCount, std::move(to_count));
  answer.set(keys::kServicesToQuery, std::move(to_query));
  return answer;
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
  record->update(*volume->string(), service_id,
                 {.amount = *amount, .timestamp = recentDate(rt::wallClockNs())},
                 platform().volumes.volumeFreespace(volume));
  static_cast<void>(validate(*record));
  daemon_->clientSetStateSync(record, keys::kRecentServiceStats);
}

SpacekeepPurgeableOperation::Record SpacekeepPurgeableOperation::storedRecord() const {
  const StateObject stored = daemon_->clientGetStateSync(keys::kRecentServiceStats);
  const auto* record = std::get_if<Record>(&stored);
  return record == nullptr ? nullptr : *record;
}

void SpacekeepPurgeableOperation::storeValidated(std::int32_t code, const Record& record) {
  if (code == SpacekeepRecentInfo::kInvalid) {
    logTrace("%s Recent Info is invalid, deleting...", "cachedInfo");
    daemon_->clientSetStateSync({}, keys::kRecentServiceStats);
  } else if (code == SpacekeepRecentInfo::kChanged) {
    if (shouldLogTrace(getLogHandle())) {
      const Value text = textForm(record);
      logTrace("%s Recent Info need syncing. New values: %@", "cachedInfo", text);
    }
    daemon_->clientSetStateSync(record, keys::kRecentServiceStats);
  }
}

std::int32_t SpacekeepPurgeableOperation::validate(SpacekeepRecentInfo& record) const {
  const RecentInfoContext context{.now = recentDate(rt::wallClockNs()),
                                  .freespace = [this](const std::string& path) {
                                    const Value volume = path;
                                    return platform().volumes.volumeFreespace(&volume);
                                  }};
  return record.validate(kAgeLimitSeconds, kFreespaceThresholdBytes, context);
}

Array SpacekeepPurgeableOperation::servicesNotIn(const Dictionary& known) const {
  Array missing;
  for (const auto& entry : services()) {
    if (!known.contains(entry.first)) missing.emplace_back(entry.first);
  }
  return missing;
}

}  // namespace spacekeep
