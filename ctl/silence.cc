// Why a service gives nothing, or is not counted.
#include <fmt/core.h>

#include <algorithm>
#include <optional>

#include "ctl/explanation.h"
#include "ctl/text_layout.h"

namespace spacekeep::ctl {
namespace {

bool answered(const VolumeOffers& offers, const std::string& id) {
  return std::ranges::any_of(offers.services, [&](const ServiceOffers& service) {
    return service.id == id &&
           std::ranges::any_of(service.bytes, [](const auto& bytes) { return bytes.has_value(); });
  });
}

std::optional<std::string> reasonFor(const VolumeFacts& facts, const DeclaredService& service) {
  const std::string path = harmless(service.path);
  if (!service.purges) {
    return fmt::format("takes no part in purges ({} gives it {})", path,
                       service.periodic ? "the role PERIODIC only" : "no role");
  }
  if (const auto socket = facts.missing_sockets.find(service.id);
      socket != facts.missing_sockets.end()) {
    return fmt::format("cannot be reached: its socket {} is missing", harmless(socket->second));
  }
  if (service.do_not_query) {
    return fmt::format(
        "is not asked how much it has ({} says SPACEKEEP_DO_NOT_QUERY); purges ask "
        "it to give all the same",
        path);
  }
  const bool known = facts.offers.detail == VolumeOffers::Detail::kServices;
  if (known && !answered(facts.offers, service.id)) {
    return fmt::format("is declared in {} and has not answered", path);
  }
  return std::nullopt;
}

/// Those that answered and have nothing here, in one line.
std::vector<Paragraph> emptyHanded(const VolumeOffers& offers) {
  std::string names;
  for (const auto& service : offers.services) {
    if (hasSomething(service)) continue;
    names += (names.empty() ? "" : ", ") + harmless(service.id);
  }
  if (names.empty()) return {};
  return {Paragraph{fmt::format("with nothing on this volume: {}", names), true}};
}

std::vector<Paragraph> withoutNumber(const VolumeOffers& offers) {
  std::vector<Paragraph> list;
  for (const auto& service : offers.services) {
    const auto known =
        std::ranges::count_if(service.bytes, [](const auto& bytes) { return bytes.has_value(); });
    if (known == kUrgencies) continue;
    list.push_back(
        Paragraph{fmt::format("{} has not answered at every urgency, or not with a number",
                              harmless(service.id)),
                  true});
  }
  return list;
}

}  // namespace

std::vector<Paragraph> silenceOf(const VolumeFacts& facts) {
  std::vector<Paragraph> list;
  for (const auto& [id, service] : facts.declared) {
    if (const auto reason = reasonFor(facts, service)) {
      list.push_back(Paragraph{fmt::format("{} {}", harmless(id), *reason), true});
    }
  }
  for (auto& more : {withoutNumber(facts.offers), emptyHanded(facts.offers)}) {
    list.insert(list.end(), more.begin(), more.end());
  }
  if (!list.empty()) list.insert(list.begin(), Paragraph{"Who gives nothing, and why:"});
  return list;
}

}  // namespace spacekeep::ctl
