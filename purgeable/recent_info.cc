#include "purgeable/recent_info.h"

#include <utility>

namespace spacekeep {
namespace {

constexpr double kNsPerSecond = 1'000'000'000.0;

// A date of the future was written by a clock that has been set back since: its age is unknown.
bool isFresh(const Date& date, const Date& now, double age_limit_seconds) {
  std::int64_t age_ns = 0;
  // Clients can put any date there; one that is centuries away has no age in 64 bits.
  if (__builtin_sub_overflow(now.unix_ns, date.unix_ns, &age_ns)) return false;
  return age_ns >= 0 && static_cast<double>(age_ns) / kNsPerSecond <= age_limit_seconds;
}

bool isNear(std::uint64_t one, std::uint64_t other, std::uint64_t threshold) {
  return (one > other ? one - other : other - one) <= threshold;
}

}  // namespace

const SpacekeepRecentVolumeInfo* SpacekeepRecentInfo::volume(const std::string& path) const {
  const auto found = volumes_.find(path);
  return found == volumes_.end() ? nullptr : &found->second;
}

void SpacekeepRecentInfo::update(const std::string& volume, const std::string& service_id,
                                 SpacekeepRecentServiceInfo answer, std::uint64_t freespace_bytes) {
  SpacekeepRecentVolumeInfo& entry = volumes_[volume];
  entry.freespace = freespace_bytes;
  entry.timestamp = answer.timestamp;
  entry.volumeName = volume;
  entry.services.insert_or_assign(service_id, std::move(answer));
}

std::int32_t SpacekeepRecentInfo::validate(double age_limit_seconds, std::uint64_t threshold_bytes,
                                           const RecentInfoContext& context) {
  std::size_t removed = std::erase_if(volumes_, [&](const auto& entry) {
    const SpacekeepRecentVolumeInfo& volume = entry.second;
    return !isFresh(volume.timestamp, context.now, age_limit_seconds) ||
           !isNear(volume.freespace, context.freespace(entry.first), threshold_bytes);
  });
  for (auto& [path, volume] : volumes_) {
    removed += std::erase_if(volume.services, [&](const auto& entry) {
      return !isFresh(entry.second.timestamp, context.now, age_limit_seconds);
    });
  }
  removed +=
      std::erase_if(volumes_, [](const auto& entry) { return entry.second.services.empty(); });
  if (volumes_.empty()) return kInvalid;
  return removed > 0 ? kChanged : kUsable;
}

Date recentDate(std::int64_t unix_ns) { return {unix_ns - unix_ns % 1000}; }

}  // namespace spacekeep
