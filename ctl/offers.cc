#include "ctl/offers.h"

#include <algorithm>

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kTotal = "SPACEKEEP_TOTAL_AVAILABLE";
constexpr std::string_view kVolume = "SPACEKEEP_VOLUME";

ServiceOffers& offersOf(VolumeOffers& offers, const std::string& id) {
  const auto found = std::ranges::find(offers.services, id, &ServiceOffers::id);
  if (found != offers.services.end()) return *found;
  return offers.services.emplace_back(ServiceOffers{.id = id, .bytes = {}});
}

bool givesMore(const ServiceOffers& one, const ServiceOffers& other) {
  for (std::size_t i = kUrgencies; i-- > 0;) {
    if (one.bytes[i] != other.bytes[i]) return one.bytes[i] > other.bytes[i];
  }
  return one.id < other.id;
}

}  // namespace

void addAnswer(VolumeOffers& offers, int urgency, const Dictionary& answer) {
  const auto index = static_cast<std::size_t>(urgency - 1);
  if (const Value* total = answer.find(kTotal)) {
    offers.total_bytes.at(index) = total->asSigned().value_or(0);
  }
  if (offers.detail != VolumeOffers::Detail::kServices) return;
  for (const auto& [key, value] : answer) {
    if (key == kTotal || key == kVolume) continue;
    offersOf(offers, key).bytes.at(index) = value.asSigned();
  }
}

void sortOffers(VolumeOffers& offers) { std::ranges::sort(offers.services, givesMore); }

bool hasSomething(const ServiceOffers& service) {
  return std::ranges::any_of(service.bytes, [](const auto& bytes) { return bytes != 0; });
}

}  // namespace spacekeep::ctl
