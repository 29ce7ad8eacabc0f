#include "ctl/purge_report.h"

#include <fmt/format.h>

#include <utility>

#include "ctl/json_text.h"

namespace spacekeep::ctl {
namespace {

constexpr int kMildestUrgency = 1;
constexpr int kHighestUrgency = 4;

std::uint64_t bytesAt(const Dictionary& info, std::string_view key) {
  return unsignedAt(info, key).value_or(0);
}

std::vector<ServiceAmount> reportingServices(const Dictionary& record) {
  std::vector<ServiceAmount> services;
  const Value* found = record.find("SPACEKEEP_REPORTING_SERVICES");
  if (found == nullptr || found->dictionary() == nullptr) return services;
  for (const auto& [id, amount] : *found->dictionary()) {
    services.push_back({id, amount.asUnsigned().value_or(0)});
  }
  return services;
}

std::vector<std::string> unansweredServices(const Dictionary& record) {
  std::vector<std::string> ids;
  const Value* found = record.find("SPACEKEEP_SERVICES_INFLIGHT");
  if (found == nullptr || found->array() == nullptr) return ids;
  for (const auto& element : *found->array()) {
    if (element.string() != nullptr) ids.push_back(*element.string());
  }
  return ids;
}

UrgencyReport urgencyReport(int urgency, const Dictionary& record) {
  return {urgency, reportingServices(record), unansweredServices(record),
          unsignedAt(record, fmt::format("SPACEKEEP_URGENCY_{}_TIMEOUT_SECONDS", urgency))};
}

std::vector<UrgencyReport> urgencyReports(const Dictionary& outcome) {
  std::vector<UrgencyReport> reports;
  for (int urgency = kMildestUrgency; urgency <= kHighestUrgency; ++urgency) {
    const Value* record = outcome.find(fmt::format("SPACEKEEP_URGENCY_{}_OPERATION_INFO", urgency));
    if (record == nullptr || record->dictionary() == nullptr) continue;
    reports.push_back(urgencyReport(urgency, *record->dictionary()));
  }
  return reports;
}

Value valueOf(const UrgencyReport& urgency) {
  Array services;
  for (const auto& service : urgency.services) {
    services.emplace_back(
        Dictionary{{"id", service.id}, {"reported_bytes", service.reported_bytes}});
  }
  Array unanswered;
  for (const auto& id : urgency.unanswered) unanswered.emplace_back(id);
  Dictionary value{{"urgency", urgency.urgency},
                   {"services", std::move(services)},
                   {"unanswered", std::move(unanswered)}};
  if (urgency.timeout_seconds) value.set("timeout_seconds", *urgency.timeout_seconds);
  return value;
}

}  // namespace

PurgeReport purgeReport(const Dictionary& outcome, std::uint64_t asked_bytes) {
  PurgeReport report;
  if (const auto* volume = stringAt(outcome, "SPACEKEEP_VOLUME")) report.volume = *volume;
  report.asked_bytes = asked_bytes;
  report.freed_bytes = bytesAt(outcome, "SPACEKEEP_AMOUNT");
  report.reported_bytes = bytesAt(outcome, "SPACEKEEP_AMOUNT_REPORTED");
  if (const auto* elapsed = outcome.find("SPACEKEEP_ELAPSED_TIME")) {
    report.elapsed_seconds = elapsed->asDouble().value_or(0);
  }
  report.free_before_bytes = bytesAt(outcome, "SPACEKEEP_FREESPACE_BEGIN");
  report.free_after_bytes = bytesAt(outcome, "SPACEKEEP_FREESPACE_END");
  report.cancelled = truthAt(outcome, "SPACEKEEP_OPERATION_CANCELLED");
  if (const auto* error = stringAt(outcome, "SPACEKEEP_ERROR")) report.error = *error;
  report.urgencies = urgencyReports(outcome);
  return report;
}

std::string jsonOf(const PurgeReport& report) {
  Array urgencies;
  for (const auto& urgency : report.urgencies) urgencies.push_back(valueOf(urgency));
  Dictionary value{{"volume", report.volume},
                   {"asked_bytes", report.asked_bytes},
                   {"freed_bytes", report.freed_bytes},
                   {"reported_bytes", report.reported_bytes},
                   {"reached", report.reached()},
                   {"cancelled", report.cancelled},
                   {"elapsed_seconds", report.elapsed_seconds},
                   {"free_before_bytes", report.free_before_bytes},
                   {"free_after_bytes", report.free_after_bytes},
                   {"urgencies", std::move(urgencies)}};
  if (report.error) value.set("error", *report.error);
  return jsonOf(Value(std::move(value)));
}

}  // namespace spacekeep::ctl
