#include "purge/outcome.h"

#include "operations/info_keys.h"

namespace spacekeep {

void UrgencyRecord::set(const std::string& key, Value value) { fields_.set(key, std::move(value)); }

void UrgencyRecord::setReported(const std::string& service_id, std::uint64_t amount_bytes) {
  if (!reporting_services_) reporting_services_.emplace();
  reporting_services_->set(service_id, amount_bytes);
}

Dictionary UrgencyRecord::snapshot() const {
  Dictionary copy = fields_;
  if (reporting_services_) copy.set(keys::kReportingServices, *reporting_services_);
  return copy;
}

void PurgeOutcome::set(const char* key, Value value) { fields_.set(key, std::move(value)); }

void PurgeOutcome::replaceWithError(const char* error_text) {
  records_.clear();
  fields_ = Dictionary{{keys::kError, error_text}};
}

void PurgeOutcome::attach(std::string key, std::shared_ptr<const UrgencyRecord> record) {
  records_.emplace_back(std::move(key), std::move(record));
}

Dictionary PurgeOutcome::snapshot() const {
  Dictionary copy = fields_;
  for (const auto& [key, record] : records_) copy.set(key, record->snapshot());
  return copy;
}

void PurgeOutcome::beginMeasuring(std::uint64_t freespace_begin_bytes) {
  fields_.set(keys::kFreespaceBegin, freespace_begin_bytes);
  if (const Value* volume = fields_.find(keys::kVolume)) measure_.set(keys::kVolume, *volume);
  measure_.set(keys::kFreespaceBegin, freespace_begin_bytes);
}

}  // namespace spacekeep
