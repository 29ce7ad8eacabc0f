#include "ctl/doctor/doctor_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstdint>
#include <string_view>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl::doctor {
namespace {

constexpr std::size_t kTextColumn = 12;  // "  not seen  "

const char* wordOf(Severity severity) {
  switch (severity) {
    case Severity::kOk:
      return "ok";
    case Severity::kAdvice:
      return "advice";
    case Severity::kProblem:
      return "problem";
    case Severity::kUnseen:
      return "not seen";
  }
  return "";
}

Colour colourOf(Severity severity) {
  switch (severity) {
    case Severity::kOk:
      return Colour::kGreen;
    case Severity::kAdvice:
      return Colour::kYellow;
    case Severity::kProblem:
      return Colour::kRed;
    case Severity::kUnseen:
      return Colour::kFaint;
  }
  return Colour::kNone;
}

std::string lineOf(const Finding& finding, const Style& style) {
  const std::string word = wordOf(finding.severity);
  const std::string head = "  " + coloured(word, colourOf(finding.severity), style) +
                           std::string(kTextColumn - 2 - word.size(), ' ');
  const std::string text =
      finding.advice.empty() ? finding.text : finding.text + ". To do: " + finding.advice;
  const std::size_t width = style.terminal ? style.columns : SIZE_MAX;
  return head + wrapped(text, width, kTextColumn).substr(kTextColumn) + "\n";
}

std::string closingLine(const std::vector<Group>& groups) {
  const std::size_t problems = countOf(groups, Severity::kProblem);
  const std::size_t advice = countOf(groups, Severity::kAdvice);
  const std::size_t unseen = countOf(groups, Severity::kUnseen);
  std::string line = problems == 0
                         ? "no problem"
                         : fmt::format("{} problem{}", problems, problems == 1 ? "" : "s");
  if (advice > 0) line += fmt::format(", {} piece{} of advice", advice, advice == 1 ? "" : "s");
  if (unseen > 0) {
    line += fmt::format("; {} thing{} could not be looked at (root sees more)", unseen,
                        unseen == 1 ? "" : "s");
  }
  return line;
}

Value valueOf(const Group& group, const Finding& finding) {
  Dictionary value{{"group", group.name},
                   {"check", finding.check},
                   {"severity", wordOf(finding.severity)},
                   {"text", finding.text}};
  if (!finding.advice.empty()) value.set("advice", finding.advice);
  return value;
}

}  // namespace

std::size_t countOf(const std::vector<Group>& groups, Severity severity) {
  std::size_t count = 0;
  for (const auto& group : groups) {
    count +=
        static_cast<std::size_t>(std::ranges::count(group.findings, severity, &Finding::severity));
  }
  return count;
}

std::string textOf(const std::vector<Group>& groups, const Style& style) {
  std::string text;
  for (const auto& group : groups) {
    if (group.findings.empty()) continue;
    text += group.name + "\n";
    for (const auto& finding : group.findings) text += lineOf(finding, style);
  }
  const std::string line = closingLine(groups);
  return text + "\n" + (style.terminal ? wrapped(line, style.columns, 0) : line) + "\n";
}

std::string jsonOf(const std::vector<Group>& groups) {
  Array findings;
  for (const auto& group : groups) {
    for (const auto& finding : group.findings) findings.push_back(valueOf(group, finding));
  }
  return ctl::jsonOf(Value(Dictionary{{"findings", std::move(findings)},
                                      {"problems", countOf(groups, Severity::kProblem)},
                                      {"advice", countOf(groups, Severity::kAdvice)},
                                      {"not_seen", countOf(groups, Severity::kUnseen)}}));
}

}  // namespace spacekeep::ctl::doctor
