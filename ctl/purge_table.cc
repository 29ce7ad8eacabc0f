#include <fmt/core.h>

#include <algorithm>
#include <cstddef>

#include "ctl/purge_report.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kUrgencyWidth = 7;
constexpr std::size_t kReportedWidth = 12;
constexpr std::size_t kLabelWidth = 10;
constexpr std::size_t kFewestIdCharacters = 8;
constexpr const char* kGap = "  ";
constexpr std::size_t kGapWidth = 2;

std::size_t widestService(const PurgeReport& report) {
  std::size_t widest = std::string_view("service").size();
  for (const auto& urgency : report.urgencies) {
    for (const auto& service : urgency.services) {
      widest = std::max(widest, displayWidth(harmless(service.id)));
    }
    for (const auto& id : urgency.unanswered) widest = std::max(widest, displayWidth(harmless(id)));
  }
  return widest;
}

/// IDs stand in full unless a person looks at a terminal that is too narrow for them.
std::size_t idWidth(std::size_t widest, const Style& style) {
  constexpr std::size_t kOthers = kUrgencyWidth + kReportedWidth + 2 * kGapWidth;
  if (!style.terminal || widest + kOthers <= style.columns) return widest;
  return std::max(style.columns - std::min(style.columns, kOthers), kFewestIdCharacters);
}

std::string row(std::string_view urgency, const std::string& id, std::size_t id_width,
                std::string_view rest) {
  std::string text = rightAligned(urgency, kUrgencyWidth) + kGap;
  text += padded(shortened(id, id_width), id_width);
  return rest.empty() ? text + "\n" : text + kGap + std::string(rest) + "\n";
}

std::string noAnswer(const UrgencyReport& urgency, std::size_t id_width, const Style& style) {
  const std::string text =
      fmt::format("did not answer within {} s", urgency.timeout_seconds.value_or(0));
  const std::size_t used = kUrgencyWidth + id_width + 2 * kGapWidth;
  return style.terminal && used + text.size() > style.columns ? "no answer" : text;
}

std::string rowsOf(const UrgencyReport& urgency, std::size_t id_width, const Style& style) {
  const std::string level = std::to_string(urgency.urgency);
  std::string text;
  for (const auto& service : urgency.services) {
    text += row(level, harmless(service.id), id_width,
                rightAligned(printSize(service.reported_bytes), kReportedWidth));
  }
  for (const auto& id : urgency.unanswered) {
    text += row(level, harmless(id), id_width, noAnswer(urgency, id_width, style));
  }
  if (!text.empty()) return text;
  const std::string nobody = "(nobody was asked)";
  return row(level, nobody, std::max(id_width, nobody.size()), "");
}

/// A service that is asked several times at one urgency is listed with its last answer only.
std::string earlierAnswers(const PurgeReport& report) {
  std::uint64_t listed_bytes = 0;
  for (const auto& urgency : report.urgencies) {
    for (const auto& service : urgency.services) listed_bytes += service.reported_bytes;
  }
  if (listed_bytes >= report.reported_bytes) return "";
  return fmt::format(
      ", {} of it in answers before the last one of a service, which is listed above",
      printSize(report.reported_bytes - listed_bytes));
}

std::string verdict(const PurgeReport& report) {
  if (report.error) return "not done: " + harmless(*report.error);
  if (report.reached()) return "reached";
  const std::string missing = printSize(report.asked_bytes - report.freed_bytes);
  return fmt::format("not reached, {} missing{}", missing,
                     report.cancelled ? " (the purge was cancelled)" : "");
}

std::string labelled(std::string_view label, const std::string& text, const Style& style) {
  const std::string head = padded(label, kLabelWidth);
  if (!style.terminal) return head + text + "\n";
  return head + wrapped(text, style.columns, kLabelWidth).substr(kLabelWidth) + "\n";
}

}  // namespace

std::string tableOf(const PurgeReport& report, const Style& style) {
  std::string text;
  if (!report.urgencies.empty()) {
    const std::size_t id_width = idWidth(widestService(report), style);
    text = row("urgency", "service", id_width, rightAligned("reported", kReportedWidth));
    for (const auto& urgency : report.urgencies) text += rowsOf(urgency, id_width, style);
    text += "\n";
  }
  text += labelled("asked", printSize(report.asked_bytes), style);
  text +=
      labelled("freed",
               fmt::format("{} ({} free before, {} after)", printSize(report.freed_bytes),
                           printSize(report.free_before_bytes), printSize(report.free_after_bytes)),
               style);
  text += labelled("reported",
                   printSize(report.reported_bytes) + " by the services" + earlierAnswers(report),
                   style);
  text += labelled("took", fmt::format("{:.1f} s", report.elapsed_seconds), style);
  return text + labelled("result", verdict(report), style);
}

}  // namespace spacekeep::ctl
