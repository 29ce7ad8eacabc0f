#include <fmt/core.h>

#include <algorithm>
#include <cstddef>

#include "ctl/query_report.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kAmountWidth = 10;  // "1023.9 MiB"
constexpr std::size_t kGap = 2;
constexpr std::size_t kFewestBarCells = 6;
constexpr std::size_t kMostBarCells = 40;
constexpr std::size_t kFewestIdCharacters = 12;

struct Columns {
  std::size_t id = 0;
  std::size_t bar = 0;     ///< 0: there is none
  std::size_t origin = 0;  ///< 0: unknown for all
  bool origin_below = false;
};

std::size_t widestId(const QueryReport& report) {
  std::size_t widest = std::string_view("service").size();
  for (const auto& service : report.services) {
    widest = std::max(widest, displayWidth(harmless(service.id)));
  }
  return widest;
}

std::size_t widestOrigin(const QueryReport& report) {
  std::size_t widest = 0;
  for (const auto& service : report.services) {
    widest = std::max(widest, textOf(service.origin).size());
  }
  return widest;
}

/// What is left of a line when `used` characters, and a gap, are taken.
std::size_t rest(std::size_t columns, std::size_t used) {
  return columns > used + kGap ? columns - used - kGap : 0;
}

/// IDs stand in full unless a person looks at a terminal that is too narrow for them.
std::size_t idWidth(std::size_t widest, const Style& style) {
  if (!style.terminal) return widest;
  return std::min(widest, std::max(rest(style.columns, kAmountWidth), kFewestIdCharacters));
}

Columns columnsFor(const QueryReport& report, const Style& style) {
  Columns columns;
  columns.id = idWidth(widestId(report), style);
  columns.origin = widestOrigin(report);
  const std::size_t used = columns.id + kGap + kAmountWidth;
  const std::size_t origin = columns.origin > 0 ? columns.origin + kGap : 0;
  std::size_t cells = rest(style.columns, used + origin);
  if (cells < kFewestBarCells) {
    columns.origin_below = style.terminal && columns.origin > 0;
    cells = columns.origin_below ? rest(style.columns, kGap + columns.origin) : 0;
  }
  if (!style.terminal) cells = std::max(cells, kFewestBarCells);
  columns.bar = cells < kFewestBarCells ? 0 : std::min(cells, kMostBarCells);
  return columns;
}

std::string amountText(const ServiceSpace& service) {
  return rightAligned(service.bytes ? printSignedSize(*service.bytes) : "?", kAmountWidth);
}

std::string barOf(const ServiceSpace& service, double most, const Columns& columns,
                  const Style& style) {
  const double bytes = static_cast<double>(service.bytes.value_or(0));
  return coloured(bar(most > 0 ? bytes / most : 0, columns.bar, style), Colour::kGreen, style);
}

std::string withoutTrailingSpaces(std::string line) {
  line.erase(line.find_last_not_of(' ') + 1);
  return line;
}

std::string rowOf(const ServiceSpace& service, double most, const Columns& columns,
                  const Style& style) {
  const std::string gap(kGap, ' ');
  std::string row =
      padded(shortened(harmless(service.id), columns.id), columns.id) + gap + amountText(service);
  if (columns.origin_below) row += "\n";
  if (columns.bar > 0) row += gap + barOf(service, most, columns, style);
  row += gap + coloured(textOf(service.origin), Colour::kFaint, style);
  return withoutTrailingSpaces(std::move(row)) + "\n";
}

std::string headerOf(const Columns& columns) {
  return padded("service", columns.id) + std::string(kGap, ' ') +
         rightAligned("could free", kAmountWidth) + "\n";
}

std::string totalOf(const QueryReport& report, const Columns& columns) {
  return padded("total", columns.id) + std::string(kGap, ' ') +
         rightAligned(printSignedSize(report.total_bytes), kAmountWidth) + "\n";
}

std::string volumeLine(const QueryReport& report) {
  if (!report.space) return "on " + harmless(report.volume);
  return fmt::format("{} of {}, which has {} ({} are free now)",
                     printShare(static_cast<double>(report.total_bytes),
                                static_cast<double>(report.space->size_bytes)),
                     harmless(report.volume), printSize(report.space->size_bytes),
                     printSize(report.space->free_bytes));
}

bool anyWithoutNumber(const QueryReport& report) {
  return std::any_of(report.services.begin(), report.services.end(),
                     [](const ServiceSpace& service) { return !service.bytes; });
}

}  // namespace

std::string itemizedTableOf(const QueryReport& report, const Style& style) {
  if (report.services.empty()) {
    return wrapped(fmt::format("No service knows of anything that it could free on {}.",
                               harmless(report.volume)),
                   style.columns, 0) +
           "\n";
  }
  const Columns columns = columnsFor(report, style);
  const double most = static_cast<double>(report.services.front().bytes.value_or(0));
  std::string text = headerOf(columns);
  for (const auto& service : report.services) text += rowOf(service, most, columns, style);
  text += "\n" + totalOf(report, columns);
  text += wrapped(volumeLine(report), style.columns, 0) + "\n";
  if (anyWithoutNumber(report)) {
    text +=
        wrapped("? is an answer that is not a number; it is not in the total", style.columns, 0) +
        "\n";
  }
  return text;
}

}  // namespace spacekeep::ctl
