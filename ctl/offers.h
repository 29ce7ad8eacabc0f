// Thread safety: pure functions over plain values.
//
// Who could give how much on a volume, at each urgency.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::ctl {

inline constexpr int kUrgencies = 4;
/// That of requests that name none, the low-space purges of the daemon among them.
inline constexpr int kDefaultUrgency = 3;

/// By urgency, of which the first is 1.
template <class T>
using ByUrgency = std::array<T, kUrgencies>;

struct ServiceOffers {
  std::string id;
  ByUrgency<std::optional<std::int64_t>> bytes;  ///< none: no answer, or one that is no number
  bool operator==(const ServiceOffers&) const = default;
};

struct VolumeOffers {
  enum class Detail {
    kNothing,  ///< the daemon was not asked, or refused
    kTotals,
    kServices,
  };
  std::string volume;
  Detail detail = Detail::kNothing;
  ByUrgency<std::int64_t> total_bytes = {};
  std::vector<ServiceOffers> services = {};  ///< only for kServices; see sortOffers()
  bool somebody_was_late = false;            ///< and may be missing
};

/// The daemon's answer to a query at `urgency` (1 to 4). The services are left out of it unless
/// `offers.detail` says that they are wanted.
void addAnswer(VolumeOffers& offers, int urgency, const Dictionary& answer);

/// The most at the highest urgency first.
void sortOffers(VolumeOffers& offers);

/// Whether it says at any urgency that it could give something, or something that is no number.
[[nodiscard]] bool hasSomething(const ServiceOffers& service);

[[nodiscard]] inline std::int64_t totalAt(const VolumeOffers& offers, int urgency) {
  return offers.total_bytes.at(static_cast<std::size_t>(urgency - 1));
}

}  // namespace spacekeep::ctl
