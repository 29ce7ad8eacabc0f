#include <fmt/core.h>

#include <algorithm>
#include <cstddef>

#include "ctl/status_report.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kHeading = "  could be freed";
constexpr std::string_view kTotalLabel = "    in total";
constexpr std::size_t kIndent = 4;
constexpr std::size_t kAmountWidth = 10;  // "1023.9 MiB"
constexpr std::size_t kGap = 2;
constexpr std::size_t kAmounts = kUrgencies * (kGap + kAmountWidth);

std::string amountText(const std::optional<std::int64_t>& bytes) {
  return bytes ? printSignedSize(*bytes) : "?";
}

std::size_t labelWidth(const std::vector<const ServiceOffers*>& services, const Style& style) {
  std::size_t widest = kHeading.size();
  for (const auto* service : services) {
    widest = std::max(widest, kIndent + displayWidth(harmless(service->id)));
  }
  return style.terminal ? std::min(widest, style.columns - kAmounts) : widest;
}

std::string row(std::string_view label, std::size_t label_width,
                const ByUrgency<std::string>& amounts) {
  std::string text = padded(label, label_width);
  for (const auto& amount : amounts) {
    text += std::string(kGap, ' ') + rightAligned(amount, kAmountWidth);
  }
  return text + "\n";
}

template <class T, class Print>
ByUrgency<std::string> printed(const ByUrgency<T>& amounts, const Print& print) {
  ByUrgency<std::string> texts;
  std::ranges::transform(amounts, texts.begin(), print);
  return texts;
}

std::string tableText(const VolumeOffers& offers, const std::vector<const ServiceOffers*>& services,
                      const Style& style) {
  const std::size_t width = labelWidth(services, style);
  std::string text = row(kHeading, width, {"urgency 1", "urgency 2", "urgency 3", "urgency 4"});
  for (const auto* service : services) {
    text += row(std::string(kIndent, ' ') + shortened(harmless(service->id), width - kIndent),
                width, printed(service->bytes, amountText));
  }
  return text + row(kTotalLabel, width, printed(offers.total_bytes, printSignedSize));
}

/// Stands for a space at which no line may be broken.
constexpr char kTied = '\x1f';

/// "urgency 1: 1.0 MiB, 2: 2.0 MiB, 3: 2.0 MiB, 4: 2.0 MiB", broken between amounts only.
std::string amountLines(const ByUrgency<std::string>& amounts, const Style& style) {
  std::string text;
  for (std::size_t i = 0; i < amounts.size(); ++i) {
    std::string item = fmt::format("{}{}: {}", i == 0 ? "urgency " : "", i + 1, amounts[i]);
    std::ranges::replace(item, ' ', kTied);
    text += (i == 0 ? "" : ", ") + item;
  }
  text = wrapped(text, style.columns, kIndent + kGap);
  std::ranges::replace(text, kTied, ' ');
  return text + "\n";
}

std::string entryText(std::string_view label, const ByUrgency<std::string>& amounts,
                      const Style& style) {
  return shortened(label, style.columns) + "\n" + amountLines(amounts, style);
}

std::string narrowText(const VolumeOffers& offers,
                       const std::vector<const ServiceOffers*>& services, const Style& style) {
  std::string text = std::string(kHeading) + "\n";
  for (const auto* service : services) {
    text += entryText(std::string(kIndent, ' ') + harmless(service->id),
                      printed(service->bytes, amountText), style);
  }
  return text + entryText(kTotalLabel, printed(offers.total_bytes, printSignedSize), style);
}

std::string restText(std::size_t count, const Style& style) {
  if (count == 0) return "";
  const std::string text = fmt::format("{} {} nothing here", count,
                                       count == 1 ? "more service has" : "more services have");
  return wrapped(text, style.columns, kIndent) + "\n";
}

}  // namespace

std::string offersText(const VolumeOffers& offers, const Style& style) {
  if (offers.detail == VolumeOffers::Detail::kNothing) return "";
  std::vector<const ServiceOffers*> giving;
  for (const auto& service : offers.services) {
    if (hasSomething(service)) giving.push_back(&service);
  }
  const bool nothing = giving.empty() && std::ranges::all_of(offers.total_bytes,
                                                             [](auto bytes) { return bytes == 0; });
  if (nothing) return "  nothing could be freed\n";
  const bool narrow = style.terminal && style.columns < kHeading.size() + kAmounts;
  const std::string text =
      narrow ? narrowText(offers, giving, style) : tableText(offers, giving, style);
  return text + restText(offers.services.size() - giving.size(), style);
}

}  // namespace spacekeep::ctl
