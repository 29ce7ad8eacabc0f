#include "sim/invariants/system/record_model.h"

#include <utility>

namespace spacekeep::sim {
namespace {

// An age of exactly the limit is believed; a date of the future is not.
bool isFresh(std::int64_t at_ns, std::int64_t now_ns) {
  if (at_ns > now_ns) return false;
  std::int64_t age_ns = 0;
  return !__builtin_sub_overflow(now_ns, at_ns, &age_ns) && age_ns <= RecordModel::kAgeLimitNs;
}

// So is a difference of exactly the threshold.
bool isNear(std::uint64_t then, std::uint64_t now) {
  const std::uint64_t moved = then < now ? now - then : then - now;
  return moved <= RecordModel::kThresholdBytes;
}

}  // namespace

void RecordModel::answer(const std::string& volume, const std::string& service, Value amount,
                         std::uint64_t free, std::int64_t now_ns) {
  Volume& entry = volumes_[volume];
  entry.services[service] = {std::move(amount), now_ns};
  entry.free = free;
  entry.at_ns = now_ns;
}

RecordModel::Verdict RecordModel::validate(std::int64_t now_ns, const FreeSpace& free) {
  bool changed = false;
  for (auto entry = volumes_.begin(); entry != volumes_.end();) {
    Volume& volume = entry->second;
    const auto space = free.find(entry->first);
    const std::uint64_t free_now = space == free.end() ? 0 : space->second;
    std::size_t old = 0;
    if (isFresh(volume.at_ns, now_ns) && isNear(volume.free, free_now)) {
      old = std::erase_if(volume.services,
                          [&](const auto& one) { return !isFresh(one.second.at_ns, now_ns); });
    } else {
      volume.services.clear();
      old = 1;
    }
    changed = changed || old > 0 || volume.services.empty();
    entry = volume.services.empty() ? volumes_.erase(entry) : std::next(entry);
  }
  if (volumes_.empty()) return Verdict::kInvalid;
  return changed ? Verdict::kChanged : Verdict::kUsable;
}

Dictionary RecordModel::amountsOf(const std::string& volume) const {
  Dictionary amounts;
  const auto found = volumes_.find(volume);
  if (found == volumes_.end()) return amounts;
  for (const auto& [service, answer] : found->second.services) amounts.set(service, answer.amount);
  return amounts;
}

Dictionary RecordModel::text() const {
  Dictionary all;
  for (const auto& [path, volume] : volumes_) all.set(path, amountsOf(path));
  return all;
}

}  // namespace spacekeep::sim
