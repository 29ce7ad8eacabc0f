#include "purgeable/recent_info.h"

#include <algorithm>
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
  Derived& derived = derived_[volume];
  const Date date = answer.timestamp;
  if (entry.services.empty()) {
    derived.span = {.oldest = date, .youngest = date};
  } else if (derived.span) {
    if (date.unix_ns < derived.span->oldest.unix_ns) derived.span->oldest = date;
    if (date.unix_ns > derived.span->youngest.unix_ns) derived.span->youngest = date;
  }
  derived.amounts = nullptr;
  entry.freespace = freespace_bytes;
  entry.timestamp = date;
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
    if (holdsOnlyFresh(path, context.now, age_limit_seconds)) continue;
    removed += removeOldAnswers(path, volume, context.now, age_limit_seconds);
  }
  removed +=
      std::erase_if(volumes_, [](const auto& entry) { return entry.second.services.empty(); });
  std::erase_if(derived_, [this](const auto& entry) { return !volumes_.contains(entry.first); });
  if (volumes_.empty()) return kInvalid;
  return removed > 0 ? kChanged : kUsable;
}

// So that an answer does not cost more the more services have answered before.
bool SpacekeepRecentInfo::holdsOnlyFresh(const std::string& volume, const Date& now,
                                         double age_limit_seconds) const {
  const auto found = derived_.find(volume);
  if (found == derived_.end() || !found->second.span) return false;
  return isFresh(found->second.span->oldest, now, age_limit_seconds) &&
         isFresh(found->second.span->youngest, now, age_limit_seconds);
}

std::size_t SpacekeepRecentInfo::removeOldAnswers(const std::string& path,
                                                  SpacekeepRecentVolumeInfo& volume,
                                                  const Date& now, double age_limit_seconds) {
  const std::size_t removed = std::erase_if(volume.services, [&](const auto& entry) {
    return !isFresh(entry.second.timestamp, now, age_limit_seconds);
  });
  Derived& derived = derived_[path];
  if (removed > 0) derived.amounts = nullptr;
  derived.span.reset();
  for (const auto& [service_id, service] : volume.services) {
    const Date date = service.timestamp;
    if (!derived.span) derived.span = {.oldest = date, .youngest = date};
    derived.span->oldest.unix_ns = std::min(derived.span->oldest.unix_ns, date.unix_ns);
    derived.span->youngest.unix_ns = std::max(derived.span->youngest.unix_ns, date.unix_ns);
  }
  return removed;
}

std::shared_ptr<const Dictionary> SpacekeepRecentInfo::amounts(const std::string& volume) {
  const auto found = volumes_.find(volume);
  if (found == volumes_.end()) return nullptr;
  std::shared_ptr<const Dictionary>& amounts = derived_[volume].amounts;
  if (!amounts) {
    Dictionary said;
    for (const auto& [service_id, service] : found->second.services) {
      said.set(service_id, service.amount);
    }
    amounts = std::make_shared<const Dictionary>(std::move(said));
  }
  return amounts;
}

// Down on both sides of 1970, or a date before it would move at each round through an archive. The
// very first microsecond of the range has nothing below it.
Date recentDate(std::int64_t unix_ns) {
  std::int64_t rest_ns = unix_ns % 1000;
  if (rest_ns < 0 && unix_ns > INT64_MIN + 1000) rest_ns += 1000;
  return {unix_ns - rest_ns};
}

}  // namespace spacekeep
