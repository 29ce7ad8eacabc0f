#include "ctl/check_service/check_report.h"

#include <fmt/core.h>

#include <algorithm>
#include <utility>

#include "ctl/json_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kNameColumns = 22;
constexpr std::size_t kNarrowColumns = 60;

const char* wordOf(Outcome outcome) {
  switch (outcome) {
    case Outcome::kOk:
      return "ok";
    case Outcome::kFailed:
      return "FAILED";
    case Outcome::kNotApplicable:
      return "not applicable";
  }
  return "";
}

Colour colourOf(Outcome outcome) {
  switch (outcome) {
    case Outcome::kOk:
      return Colour::kGreen;
    case Outcome::kFailed:
      return Colour::kRed;
    case Outcome::kNotApplicable:
      return Colour::kYellow;
  }
  return Colour::kNone;
}

/// What stands between the word and the text.
const char* joint(const Finding& finding) {
  if (finding.text.empty()) return "";
  return finding.outcome == Outcome::kOk ? ", " : ": ";
}

}  // namespace

std::size_t CheckReport::count(Outcome outcome) const {
  return static_cast<std::size_t>(std::count_if(
      results.begin(), results.end(),
      [outcome](const CheckResult& result) { return result.finding.outcome == outcome; }));
}

std::string lineOf(const CheckResult& result, const Style& style) {
  const Finding& finding = result.finding;
  const std::string word = wordOf(finding.outcome);
  const std::string shown = coloured(word, colourOf(finding.outcome), style);
  const std::string text = word + joint(finding) + finding.text;
  const bool narrow = style.columns < kNarrowColumns;
  const std::string name = padded(result.name, kNameColumns);
  if (!style.terminal) return fmt::format("{}{}\n", name, text);
  const std::size_t indent = narrow ? 2 : kNameColumns;
  std::string lines = wrapped(text, style.columns, indent);
  lines.replace(indent, word.size(), shown);  // colours have no width
  return narrow ? fmt::format("{}\n{}\n", result.name, lines)
                : fmt::format("{}{}\n", name, lines.substr(indent));
}

std::string summaryOf(const CheckReport& report) {
  const std::size_t all = report.results.size();
  return fmt::format("{} check{}: {} ok, {} failed, {} not applicable", all, all == 1 ? "" : "s",
                     report.count(Outcome::kOk), report.count(Outcome::kFailed),
                     report.count(Outcome::kNotApplicable));
}

std::string jsonOf(const CheckReport& report) {
  Array checks;
  for (const auto& [name, finding] : report.results) {
    checks.emplace_back(
        Dictionary{{"check", name}, {"result", wordOf(finding.outcome)}, {"text", finding.text}});
  }
  return jsonOf(Value(Dictionary{{"service", report.service},
                                 {"volume", report.volume},
                                 {"checks", std::move(checks)},
                                 {"ok", report.count(Outcome::kOk)},
                                 {"failed", report.count(Outcome::kFailed)},
                                 {"not_applicable", report.count(Outcome::kNotApplicable)}}));
}

}  // namespace spacekeep::ctl
