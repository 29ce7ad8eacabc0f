#include "ctl/explanation.h"

#include <fmt/core.h>

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <iterator>
#include <utility>

#include "ctl/size_text.h"
#include "ctl/status_report.h"
#include "ctl/supply.h"
#include "ctl/text_layout.h"
#include "daemon/low_disk.h"

namespace spacekeep::ctl {
namespace {

constexpr std::size_t kIndent = 2;
constexpr std::size_t kItemIndent = 4;
constexpr std::size_t kNamedServices = 3;

bool isShort(const VolumeFacts& facts) { return facts.sample.level != SpaceLevel::kEnough; }

Paragraph verdict(const VolumeFacts& facts) {
  const std::string volume = harmless(facts.sample.volume);
  if (!isShort(facts)) return Paragraph{fmt::format("{} is not short of space.", volume)};
  return Paragraph{
      fmt::format("{} is {}: {}.", volume, wordOf(facts.sample.level), shortageOf(facts.sample))};
}

/// What made the threshold what it is.
std::string limitText(const VolumeFacts& facts) {
  const VolumeSpace& space = facts.sample.space;
  const double percent_bytes = static_cast<double>(space.size_bytes) * facts.settings.percent / 100;
  return fmt::format("the smaller of {:g} % of its size ({}) and {}", facts.settings.percent,
                     printSize(static_cast<std::uint64_t>(percent_bytes)),
                     printSize(facts.settings.bytes));
}

Paragraph spaceParagraph(const VolumeFacts& facts) {
  const VolumeSpace& space = facts.sample.space;
  const SpaceThresholds& thresholds = facts.sample.thresholds;
  return Paragraph{fmt::format(
      "Space: {} of {} can still be used. It is low below {}, {}, and very low below {}, a third "
      "of that. Once it is low it stays so until {} are free.",
      printSize(space.available_bytes), printSize(space.size_bytes),
      printSize(thresholds.low_bytes), limitText(facts), printSize(thresholds.very_low_bytes),
      printSize(exitThreshold(thresholds.low_bytes)))};
}

Paragraph inodesParagraph(const VolumeFacts& facts) {
  const VolumeSpace& space = facts.sample.space;
  const SpaceThresholds& thresholds = facts.sample.thresholds;
  if (space.inodes == 0) return Paragraph{"Inodes: the file system makes them as it needs them."};
  return Paragraph{
      fmt::format("Inodes: {} of {} are free. It is low below {}, {:g} % of them, and very "
                  "low below {}.",
                  printCount(space.available_inodes), printCount(space.inodes),
                  printCount(thresholds.low_inodes), facts.settings.inodes_percent,
                  printCount(thresholds.very_low_inodes))};
}

Paragraph daemonParagraph(const VolumeFacts& facts) {
  if (!isShort(facts)) {
    return Paragraph{"The daemon does nothing by itself here as long as the volume is not short."};
  }
  const char* end = facts.finish_early
                        ? "It ends as soon as that is there (SPACEKEEP_FINISH_EARLY is true)."
                        : "It waits out every urgency even when that is there earlier, and other "
                          "purges stand behind it (spacekeepctl state set SPACEKEEP_FINISH_EARLY "
                          "true changes that).";
  return Paragraph{
      fmt::format("While the volume is short, the daemon asks the services for {} at a time, "
                  "from urgency 1 up to {}, and waits at each for at most {} s. {}",
                  printSize(kLowDiskAmountBytes), kDefaultUrgency, kLowDiskTimeoutSeconds, end)};
}

/// ", from a (12.0 MiB), b (8.0 MiB) and 2 more".
std::string giversAt(const VolumeOffers& offers, std::size_t index) {
  std::vector<std::pair<std::int64_t, std::string>> givers;
  for (const auto& service : offers.services) {
    const auto bytes = service.bytes.at(index).value_or(0);
    if (bytes > 0) givers.emplace_back(-bytes, harmless(service.id));
  }
  std::ranges::sort(givers);
  std::string text;
  for (std::size_t i = 0; i < std::min(givers.size(), kNamedServices); ++i) {
    text += fmt::format("{}{} ({})", text.empty() ? ", from " : ", ", givers[i].second,
                        printSignedSize(-givers[i].first));
  }
  if (givers.size() <= kNamedServices) return text;
  return text + fmt::format(" and {} more", givers.size() - kNamedServices);
}

std::vector<Paragraph> offerParagraphs(const VolumeFacts& facts) {
  if (facts.offers.detail == VolumeOffers::Detail::kNothing) return {};
  std::vector<Paragraph> list;
  list.push_back(Paragraph{"What could be freed:"});
  for (std::size_t i = 0; i < kUrgencies; ++i) {
    list.push_back(Paragraph{
        fmt::format("urgency {}: {}{}", i + 1, printSignedSize(facts.offers.total_bytes[i]),
                    giversAt(facts.offers, i)),
        true});
  }
  return list;
}

std::string enoughText(std::int64_t needed, const VolumeOffers& offers) {
  const std::int64_t usual = totalAt(offers, kDefaultUrgency);
  const std::int64_t most = totalAt(offers, kUrgencies);
  if (usual >= needed) {
    return fmt::format("The services could give that at urgency {}.", kDefaultUrgency);
  }
  const std::string missing =
      fmt::format("At urgency {}, as far as the daemon goes by itself, {} of it are missing.",
                  kDefaultUrgency, printSignedSize(needed - std::max<std::int64_t>(usual, 0)));
  if (most >= needed) {
    return missing + fmt::format(
                         " Urgency {}, which somebody has to ask for (spacekeepctl purge "
                         "--urgency {}), would be enough.",
                         kUrgencies, kUrgencies);
  }
  return missing +
         " Not even the highest urgency is enough: what fills the volume belongs to no "
         "service, and somebody has to remove it.";
}

std::vector<Paragraph> wayOut(const VolumeFacts& facts) {
  const SpaceThresholds& thresholds = facts.sample.thresholds;
  const VolumeSpace& space = facts.sample.space;
  if (!isShort(facts)) return {};
  if (space.available_bytes >= thresholds.low_bytes) {
    return {Paragraph{
        "The volume has room but too many files. Services tell how many bytes they could free, "
        "not how many files, so it cannot be said whether a purge would help."}};
  }
  const auto needed =
      static_cast<std::int64_t>(exitThreshold(thresholds.low_bytes) - space.available_bytes);
  std::string text =
      fmt::format("To be short no longer it takes {} more.", printSignedSize(needed));
  if (facts.offers.detail != VolumeOffers::Detail::kNothing) {
    text += " " + enoughText(needed, facts.offers);
  }
  return {Paragraph{std::move(text)}};
}

void append(std::vector<Paragraph>& list, std::vector<Paragraph> more) {
  std::ranges::move(more, std::back_inserter(list));
}

}  // namespace

std::vector<Paragraph> explanationOf(const VolumeFacts& facts) {
  std::vector<Paragraph> list{verdict(facts), spaceParagraph(facts), inodesParagraph(facts),
                              daemonParagraph(facts)};
  append(list, offerParagraphs(facts));
  append(list, wayOut(facts));
  append(list, silenceOf(facts));
  append(list, facts.past);
  return list;
}

std::string textOf(const std::vector<Paragraph>& explanation, const Style& style) {
  std::string text;
  for (const auto& paragraph : explanation) {
    const std::size_t indent = text.empty() ? 0 : paragraph.is_item ? kItemIndent : kIndent;
    const std::size_t width = style.terminal ? style.columns : SIZE_MAX;
    text += wrapped(paragraph.text, width, indent) + "\n";
  }
  return text;
}

}  // namespace spacekeep::ctl
