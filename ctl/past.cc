#include "ctl/past.h"

#include <fmt/core.h>

#include <algorithm>

#include "ctl/daemon_link.h"
#include "ctl/history/pages.h"
#include "ctl/size_text.h"
#include "ctl/text_layout.h"
#include "history/entry.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kMostOfOneVolume = 3;
constexpr std::size_t kIndent = 2;
constexpr std::uint64_t kMostAggressiveUrgency = 4;
constexpr std::chrono::milliseconds kPatience{3'000};

std::string agoOf(const HistoryEntry& entry, const Date& now) {
  if (!entry.ended) return "once";
  return printAge(static_cast<double>(now.unix_ns - entry.ended->unix_ns) / 1e9) + " ago";
}

std::string deedOf(const HistoryEntry& entry, const HistoryWords& words) {
  const std::string freed = entry.freed_bytes ? printSize(*entry.freed_bytes) : "nothing";
  if (entry.kind == history::kDailyPass) return "the daily pass gained " + freed;
  const std::string who = entry.client ? askerOf(entry, words) : "the daemon, short of space,";
  const std::string asked = entry.asked_bytes ? printSize(*entry.asked_bytes) : "something";
  return fmt::format("{} asked for {} and got {}", who, asked, freed);
}

/// The newest that was asked for an amount.
const HistoryEntry* lastPurge(const std::vector<HistoryEntry>& entries) {
  const auto found = std::ranges::find_if(
      entries, [](const HistoryEntry& entry) { return entry.kind != history::kDailyPass; });
  return found == entries.end() ? nullptr : &*found;
}

std::string adviceFor(const HistoryEntry& purge) {
  if (purge.why_short == history::kNoServices) {
    return "The last purge found nobody to ask: \"spacekeepctl doctor\" tells which services there "
           "should be.";
  }
  if (purge.why_short == history::kNoAnswerInTime) {
    return "The last purge did not wait longer for those that had not answered: \"spacekeepctl "
           "doctor\" asks each of them.";
  }
  if (purge.why_short != history::kNothingMoreToGive) return "";
  const std::uint64_t limit = purge.urgency_limit.value_or(kMostAggressiveUrgency);
  return limit < kMostAggressiveUrgency
             ? fmt::format(
                   "In the last purge everybody had answered and had no more to give up to "
                   "urgency {}; a higher one takes more.",
                   limit)
             : "In the last purge everybody had answered and had no more to give at any urgency; "
               "more can only come from more services.";
}

}  // namespace

Past pastOf(const CommonOptions& common, const VolumeReport& volumes) {
  Past past;
  auto client = connectTo(common);
  if (!client) return past;
  for (const VolumeSample& sample : volumes.volumes) {
    const HistoryFilter filter{.wanted = {.volume = sample.volume, .since_ns = {}},
                               .limit = kMostOfOneVolume};
    auto list = newestEntries(filter, historyOver(*client, kPatience));
    if (!list || list->refused) return past;
    if (!list->entries.empty()) past.emplace(sample.volume, std::move(list->entries));
  }
  return past;
}

std::string sentenceOf(const HistoryEntry& entry, const Date& now, const HistoryWords& words) {
  const std::string shortfall = shortfallOf(entry);
  return fmt::format("{} {}{}{}", agoOf(entry, now), deedOf(entry, words),
                     shortfall.empty() ? "" : ": ", shortfall);
}

std::string pastLines(const std::vector<std::string>& sentences, const Style& style) {
  std::string text;
  for (const std::string& sentence : sentences) {
    const std::string line = style.terminal ? wrapped(sentence, style.columns, kIndent)
                                            : std::string(kIndent, ' ') + sentence;
    text += coloured(line, Colour::kFaint, style) + "\n";
  }
  return text;
}

std::vector<Paragraph> pastParagraphs(const std::vector<HistoryEntry>& entries, const Date& now,
                                      const HistoryWords& words) {
  std::vector<Paragraph> paragraphs;
  if (entries.empty()) return paragraphs;
  paragraphs.push_back({.text = "What the daemon did here last:"});
  for (const HistoryEntry& entry : entries) {
    paragraphs.push_back({.text = sentenceOf(entry, now, words), .is_item = true});
  }
  const HistoryEntry* purge = lastPurge(entries);
  const std::string advice = purge == nullptr ? "" : adviceFor(*purge);
  if (!advice.empty()) paragraphs.push_back({.text = advice});
  return paragraphs;
}

}  // namespace spacekeep::ctl
