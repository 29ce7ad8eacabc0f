#include "ctl/history/table.h"

#include <fmt/core.h>

#include <algorithm>
#include <array>
#include <cstddef>
#include <ctime>
#include <string_view>
#include <utility>

#include "ctl/size_text.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kAmountWidth = 10;  // "1023.9 MiB"
constexpr std::size_t kGap = 2;
constexpr std::size_t kIndent = 4;
constexpr std::size_t kFewestVolumeCharacters = 8;
constexpr std::string_view kWhen = "when";
constexpr std::string_view kVolume = "volume";

std::string gap() { return std::string(kGap, ' '); }

struct Columns {
  std::size_t when = kWhen.size();
  std::size_t volume = kVolume.size();
};

std::string momentOf(const HistoryEntry& entry, const HistoryWords& words) {
  return entry.ended ? words.moment(*entry.ended) : "?";
}

std::string amountText(const std::optional<std::uint64_t>& bytes) {
  return rightAligned(bytes ? printSize(*bytes) : "-", kAmountWidth);
}

Columns columnsFor(const HistoryList& list, const HistoryWords& words, const Style& style) {
  Columns columns;
  for (const HistoryEntry& entry : list.entries) {
    columns.when = std::max(columns.when, displayWidth(momentOf(entry, words)));
    columns.volume = std::max(columns.volume, displayWidth(harmless(entry.volume)));
  }
  // Who asked stands behind the volume and needs its room as well.
  const std::size_t before = columns.when + 2 * (kGap + kAmountWidth) + kGap;
  const std::size_t room = style.columns > before ? (style.columns - before) / 2 : 0;
  if (style.terminal) {
    columns.volume = std::min(columns.volume, std::max(room, kFewestVolumeCharacters));
  }
  return columns;
}

std::string withoutTrailingSpaces(std::string line) {
  line.erase(line.find_last_not_of(' ') + 1);
  return line;
}

std::string lineOf(const HistoryEntry& entry, const Columns& columns, const HistoryWords& words,
                   const Style& style) {
  std::string line = padded(momentOf(entry, words), columns.when) + gap() +
                     amountText(entry.asked_bytes) + gap() + amountText(entry.freed_bytes) + gap() +
                     padded(shortened(harmless(entry.volume), columns.volume), columns.volume) +
                     gap();
  const std::string asker = askerOf(entry, words);
  const std::size_t used = displayWidth(line);
  const bool fits = !style.terminal || used + displayWidth(asker) <= style.columns;
  if (fits) return withoutTrailingSpaces(line + asker) + "\n";
  const std::size_t room = style.columns > kIndent ? style.columns - kIndent : 1;
  return withoutTrailingSpaces(std::move(line)) + "\n" + std::string(kIndent, ' ') +
         shortened(asker, room) + "\n";
}

std::string giversOf(const HistoryEntry& entry) {
  std::string text;
  for (const auto& [service_id, bytes] : entry.services) {
    if (bytes == 0) continue;
    text += (text.empty() ? "" : ", ") + harmless(service_id) + " " + printSize(bytes);
  }
  if (entry.other_services_bytes.value_or(0) != 0) {
    text += (text.empty() ? "" : ", ") + std::string("others ") +
            printSize(*entry.other_services_bytes);
  }
  return text;
}

std::string courseOf(const HistoryEntry& entry) {
  std::string text = giversOf(entry);
  if (text.empty()) text = "nobody gave anything";
  if (entry.elapsed_seconds) text += fmt::format("; {:.1f} s", *entry.elapsed_seconds);
  if (entry.urgency) text += fmt::format(", urgency {}", *entry.urgency);
  return text;
}

std::string detail(const std::string& text, Colour colour, const Style& style) {
  const std::string line =
      style.terminal ? wrapped(text, style.columns, kIndent) : std::string(kIndent, ' ') + text;
  return coloured(line, colour, style) + "\n";
}

std::string blockOf(const HistoryEntry& entry, const Columns& columns, const HistoryWords& words,
                    const Style& style) {
  std::string text = lineOf(entry, columns, words, style);
  const std::string shortfall = shortfallOf(entry);
  if (!shortfall.empty()) text += detail("fell short: " + shortfall, Colour::kYellow, style);
  const bool went_on = entry.freed_bytes.has_value();
  if (went_on) text += detail(courseOf(entry), Colour::kFaint, style);
  return text;
}

std::string closingLine(const HistoryList& list) {
  if (list.older) {
    return fmt::format("the newest {}; --limit shows more", printCount(list.entries.size()));
  }
  return fmt::format("{} {}", printCount(list.entries.size()),
                     list.entries.size() == 1 ? "entry" : "entries");
}

}  // namespace

HistoryWords localWords() {
  return {.user = userName, .moment = [](const Date& date) {
            const auto seconds = static_cast<std::time_t>(date.unix_ns / 1'000'000'000);
            std::tm local{};
            std::array<char, 32> text{};
            if (::localtime_r(&seconds, &local) == nullptr) return std::string("?");
            std::strftime(text.data(), text.size(), "%Y-%m-%d %H:%M", &local);
            return std::string(text.data());
          }};
}

std::string askerOf(const HistoryEntry& entry, const HistoryWords& words) {
  if (!entry.client) return "daemon: " + harmless(entry.kind);
  const HistoryClient& client = *entry.client;
  std::string name = client.program;
  if (name.empty()) name = client.unit;
  if (name.empty()) name = client.pid ? fmt::format("process {}", *client.pid) : "somebody";
  const std::string user = client.uid ? " (" + harmless(words.user(*client.uid)) + ")" : "";
  return harmless(name) + user;
}

std::string shortfallOf(const HistoryEntry& entry) {
  std::string text = harmless(entry.why_short);
  if (text.empty() || entry.silent.empty()) return text;
  std::string silent;
  for (const std::string& service_id : entry.silent) {
    silent += (silent.empty() ? "" : ", ") + harmless(service_id);
  }
  return text + " from " + silent;
}

std::string textOf(const HistoryList& list, const HistoryWords& words, const Style& style) {
  if (list.entries.empty()) return "Nothing was done, as far as the daemon remembers.\n";
  const Columns columns = columnsFor(list, words, style);
  std::string text = padded(kWhen, columns.when) + gap() + rightAligned("asked", kAmountWidth) +
                     gap() + rightAligned("freed", kAmountWidth) + gap() +
                     padded(kVolume, columns.volume) + gap() + "who\n";
  for (const HistoryEntry& entry : list.entries) text += blockOf(entry, columns, words, style);
  return text + closingLine(list) + "\n";
}

}  // namespace spacekeep::ctl
