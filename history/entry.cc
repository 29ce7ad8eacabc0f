#include "history/entry.h"

#include <algorithm>
#include <utility>
#include <vector>

#include "history/history_keys.h"
#include "operations/info_keys.h"
#include "purge/decisions.h"

namespace spacekeep::history {
namespace {

constexpr const char* kRefused = "refused: ";

Dictionary begunEntry(const char* kind, Date ended, const Dictionary& request) {
  Dictionary entry{{keys::kDate, ended}, {keys::kKind, kind}};
  if (const std::string* volume = stringAt(request, keys::kVolume)) {
    entry.set(keys::kVolume, *volume);
  }
  return entry;
}

Dictionary dictionaryOf(const Asker& asker) {
  Dictionary client{{keys::kUid, asker.uid}, {keys::kPid, asker.pid}};
  if (asker.program) client.set(keys::kProgram, *asker.program);
  if (asker.unit) client.set(keys::kUnit, *asker.unit);
  return client;
}

void copyNumber(Dictionary& entry, const char* key, const Dictionary& source,
                const char* source_key) {
  const Value* value = source.find(source_key);
  if (value != nullptr && value->isNumber()) entry.set(key, *value);
}

std::uint64_t sumOf(std::uint64_t left_bytes, std::uint64_t right_bytes) {
  return right_bytes > UINT64_MAX - left_bytes ? UINT64_MAX : left_bytes + right_bytes;
}

// Those that gave most are named, the others are added up.
void nameGivers(Dictionary& entry, const std::map<std::string, std::uint64_t>& reported) {
  std::vector<std::pair<std::string, std::uint64_t>> givers(reported.begin(), reported.end());
  std::ranges::stable_sort(givers, std::ranges::greater(),
                           &std::pair<std::string, std::uint64_t>::second);
  Dictionary named;
  std::optional<std::uint64_t> others_bytes;
  for (const auto& [service_id, bytes] : givers) {
    if (named.size() < kMaxNamedServices && service_id.size() <= kMaxNamedIdBytes) {
      named.set(service_id, bytes);
    } else {
      others_bytes = sumOf(others_bytes.value_or(0), bytes);
    }
  }
  if (!named.empty()) entry.set(keys::kReportingServices, std::move(named));
  if (others_bytes) entry.set(keys::kOtherServices, *others_bytes);
}

template <class Ids, class TextOf>
void nameSilent(Dictionary& entry, const Ids& service_ids, TextOf text_of) {
  Array named;
  for (const auto& service_id : service_ids) {
    const std::string* text = text_of(service_id);
    if (named.size() == kMaxNamedServices) break;
    if (text != nullptr && text->size() <= kMaxNamedIdBytes) named.push_back(*text);
  }
  if (!named.empty()) entry.set(keys::kServicesInFlight, std::move(named));
}

/// What happened at one urgency, null when that was not reached. The outcome echoes the request, so
/// what the request holds under the same key tells nothing.
const Dictionary* recordAt(const PurgeFacts& facts, std::int32_t urgency) {
  const std::string key = purge::urgencyInfoKey(urgency);
  const Value* record = facts.outcome.find(key);
  if (record == nullptr || facts.request.contains(key)) return nullptr;
  return record->dictionary();
}

/// Null when all had answered.
const Array* silentIn(const Dictionary& record) {
  const Value* silent = record.find(keys::kServicesInFlight);
  const Array* service_ids = silent == nullptr ? nullptr : silent->array();
  return service_ids == nullptr || service_ids->empty() ? nullptr : service_ids;
}

bool namesAnybody(const Dictionary& record) {
  return silentIn(record) != nullptr || record.contains(keys::kReportingServices);
}

struct Reached {
  std::optional<std::int32_t> urgency;  ///< the highest at which somebody was asked
  const Array* silent = nullptr;        ///< who had not answered at the last urgency
};

Reached reachedBy(const PurgeFacts& facts) {
  Reached reached;
  for (std::int32_t urgency = 1; urgency <= facts.urgency_limit; ++urgency) {
    const Dictionary* record = recordAt(facts, urgency);
    if (record == nullptr) continue;
    reached.silent = silentIn(*record);
    if (namesAnybody(*record)) reached.urgency = urgency;
  }
  return reached;
}

bool wasCancelled(const PurgeFacts& facts) {
  return facts.outcome.contains(keys::kOperationCancelled) &&
         !facts.request.contains(keys::kOperationCancelled);
}

const char* whyShort(const PurgeFacts& facts, bool somebody_is_silent) {
  const auto freed_bytes = unsignedAt(facts.outcome, keys::kAmount).value_or(0);
  if (freed_bytes >= unsignedAt(facts.request, keys::kAmount).value_or(0)) return nullptr;
  if (wasCancelled(facts)) return kCancelled;
  if (facts.services == 0) return kNoServices;
  return somebody_is_silent || facts.reported_by_service.empty() ? kNoAnswerInTime
                                                                 : kNothingMoreToGive;
}

/// The text with which a purge was refused after it had begun, null when it was not.
const std::string* refusalOf(const Dictionary& outcome) {
  return outcome.size() == 1 ? stringAt(outcome, keys::kError) : nullptr;
}

void setCourse(Dictionary& entry, const PurgeFacts& facts) {
  copyNumber(entry, keys::kFreespaceBegin, facts.outcome, keys::kFreespaceBegin);
  copyNumber(entry, keys::kFreespaceEnd, facts.outcome, keys::kFreespaceEnd);
  copyNumber(entry, keys::kAmountFreed, facts.outcome, keys::kAmount);
  copyNumber(entry, keys::kAmountReported, facts.outcome, keys::kAmountReported);
  copyNumber(entry, keys::kElapsedTime, facts.outcome, keys::kElapsedTime);
  nameGivers(entry, facts.reported_by_service);
  const Reached reached = reachedBy(facts);
  if (reached.urgency) entry.set(keys::kUrgency, *reached.urgency);
  if (reached.silent != nullptr) {
    nameSilent(entry, *reached.silent, [](const Value& id) { return id.string(); });
  }
  if (wasCancelled(facts)) entry.set(keys::kOperationCancelled, true);
  if (const char* why = whyShort(facts, reached.silent != nullptr)) entry.set(keys::kWhyShort, why);
}

}  // namespace

Dictionary purgeEntry(const PurgeFacts& facts) {
  Dictionary entry = begunEntry(facts.client ? kPurge : kLowSpace, facts.ended, facts.request);
  if (facts.client) entry.set(keys::kClient, dictionaryOf(*facts.client));
  copyNumber(entry, keys::kAmount, facts.request, keys::kAmount);
  entry.set(keys::kUrgencyLimit, facts.urgency_limit);
  if (const std::string* refusal = refusalOf(facts.outcome)) {
    entry.set(keys::kWhyShort, kRefused + *refusal);
  } else {
    setCourse(entry, facts);
  }
  return entry;
}

Dictionary dailyPassEntry(const DailyPassFacts& facts) {
  const std::uint64_t begin_bytes = facts.freespace_begin_bytes;
  const std::uint64_t end_bytes = facts.freespace_end_bytes;
  Dictionary entry = begunEntry(kDailyPass, facts.ended, facts.request);
  entry.set(keys::kFreespaceBegin, begin_bytes);
  entry.set(keys::kFreespaceEnd, end_bytes);
  entry.set(keys::kAmountFreed, end_bytes > begin_bytes ? end_bytes - begin_bytes : 0);
  copyNumber(entry, keys::kAmountReported, facts.outcome, keys::kAmount);
  entry.set(keys::kElapsedTime, facts.elapsed_seconds);
  nameSilent(entry, facts.in_flight, [](const std::string& id) { return &id; });
  if (facts.services == 0) {
    entry.set(keys::kWhyShort, kNoServices);
  } else if (!facts.in_flight.empty()) {
    entry.set(keys::kWhyShort, kNoAnswerInTime);
  }
  return entry;
}

}  // namespace spacekeep::history
