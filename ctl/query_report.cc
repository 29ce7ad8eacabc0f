#include "ctl/query_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kTotal = "SPACEKEEP_TOTAL_AVAILABLE";
constexpr std::string_view kVolume = "SPACEKEEP_VOLUME";

bool givesMore(const ServiceSpace& one, const ServiceSpace& other) {
  if (one.bytes != other.bytes) return one.bytes > other.bytes;  // none is less than any number
  return one.id < other.id;
}

ServiceSpace serviceSpace(const std::string& id, const Value& answer,
                          const MemoryOfDaemon& memory) {
  ServiceSpace service{.id = id, .answer = answer, .bytes = answer.asSigned(), .origin = {}};
  if (memory.before && memory.after) {
    service.origin = originOf(id, *memory.before, *memory.after, memory.now);
  }
  return service;
}

struct Tally {
  std::size_t asked = 0;
  std::size_t from_memory = 0;
  std::size_t unknown = 0;
  std::size_t without_number = 0;
  double oldest_seconds = 0;
};

Tally tallyOf(const QueryReport& report) {
  Tally tally;
  for (const auto& service : report.services) {
    if (!service.bytes) ++tally.without_number;
    if (!service.origin) {
      ++tally.unknown;
    } else if (service.origin->from_memory) {
      ++tally.from_memory;
      tally.oldest_seconds = std::max(tally.oldest_seconds, service.origin->age_seconds);
    } else {
      ++tally.asked;
    }
  }
  return tally;
}

std::string servicesIn(std::size_t count) {
  return fmt::format("{} service{}", count, count == 1 ? "" : "s");
}

std::string totalLine(const QueryReport& report) {
  std::string text = fmt::format("{} could be freed on {}", printSignedSize(report.total_bytes),
                                 harmless(report.volume));
  if (!report.space) return text;
  return text + fmt::format(", {} of its {} ({} are free now)",
                            printShare(static_cast<double>(report.total_bytes),
                                       static_cast<double>(report.space->size_bytes)),
                            printSize(report.space->size_bytes),
                            printSize(report.space->free_bytes));
}

std::string originLine(const Tally& tally) {
  if (tally.from_memory + tally.asked == 0 || tally.unknown > 0) return "";
  const std::string asked = fmt::format("{} asked now", servicesIn(tally.asked));
  if (tally.from_memory == 0) return asked;
  const std::string age = printAge(tally.oldest_seconds);
  if (tally.asked == 0) {
    return fmt::format("{} from memory, at most {} old", servicesIn(tally.from_memory), age);
  }
  return fmt::format("{}, {} from memory, at most {} old", asked, tally.from_memory, age);
}

/// Elsewhere than on a terminal a line stays one line.
std::string fitted(const std::string& line, const Style& style) {
  return (style.terminal ? wrapped(line, style.columns, 0) : line) + "\n";
}

Value valueOf(const ServiceSpace& service) {
  Dictionary value{{"id", service.id}};
  if (service.bytes) {
    value.set("bytes", *service.bytes);
  } else {
    value.set("answer", service.answer);
  }
  if (service.origin) {
    value.set("from_memory", service.origin->from_memory);
    value.set("age_seconds", service.origin->age_seconds);
  }
  return value;
}

}  // namespace

QueryReport queryReport(const Dictionary& answer, const MemoryOfDaemon& memory,
                        std::optional<MeasuredSpace> space) {
  QueryReport report;
  report.space = space;
  if (const auto* volume = stringAt(answer, kVolume)) report.volume = *volume;
  if (const auto* total = answer.find(kTotal)) report.total_bytes = total->asSigned().value_or(0);
  for (const auto& [key, value] : answer) {
    if (key == kTotal || key == kVolume) continue;
    report.services.push_back(serviceSpace(key, value, memory));
  }
  std::sort(report.services.begin(), report.services.end(), givesMore);
  return report;
}

std::string summaryOf(const QueryReport& report, const Style& style) {
  const Tally tally = tallyOf(report);
  std::string text = fitted(totalLine(report), style);
  if (const std::string origins = originLine(tally); !origins.empty()) {
    text += fitted(origins, style);
  }
  if (tally.without_number > 0) {
    text +=
        fitted(fmt::format("{} gave no number and {} not counted", servicesIn(tally.without_number),
                           tally.without_number == 1 ? "is" : "are"),
               style);
  }
  return text;
}

std::string jsonOf(const QueryReport& report, bool itemized) {
  const Tally tally = tallyOf(report);
  Dictionary value{{"volume", report.volume}, {"total_bytes", report.total_bytes}};
  if (report.space) {
    value.set("size_bytes", report.space->size_bytes);
    value.set("free_bytes", report.space->free_bytes);
  }
  if (tally.unknown == 0) {
    value.set("asked_services", tally.asked);
    value.set("remembered_services", tally.from_memory);
  }
  if (itemized) {
    Array services;
    for (const auto& service : report.services) services.push_back(valueOf(service));
    value.set("services", std::move(services));
  }
  return jsonOf(Value(std::move(value)));
}

}  // namespace spacekeep::ctl
