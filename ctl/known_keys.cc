#include "ctl/known_keys.h"

#include <fmt/core.h>

#include <algorithm>
#include <array>

#include "ctl/size_text.h"
#include "ctl/state_value.h"
#include "operations/info_keys.h"
#include "support/volumes/low_space_settings.h"

namespace spacekeep::ctl {
namespace {

constexpr std::string_view kCacheEnabled = "SPACEKEEP_CACHE_ENABLED";
constexpr std::string_view kFinishEarly = "SPACEKEEP_FINISH_EARLY";

constexpr std::array kSettable = {
    KnownKey{kCacheEnabled, "whether caches are wanted; a change is told to the services that ask",
             "true"},
    KnownKey{kFinishEarly, "whether a purge ends once the amount is reached, unless it says itself",
             "false"},
    KnownKey{kLowSpaceBytesKey, "a volume with more than this available is never low", "500.0 MiB",
             true},
    KnownKey{kLowSpaceInodesPercentKey, "a volume is low below this percentage of its inodes", "5"},
    KnownKey{kLowSpacePercentKey, "a volume is low below this percentage of its size", "5"},
};

constexpr KnownKey kRecentStats{
    kRecentStatsKey, "the daemon's memory of answers; unset, the next query asks everybody", ""};
/// The urgency follows the name.
constexpr KnownKey kRecentStatsAtUrgency{
    keys::kRecentServiceStatsAtUrgency,
    "the memory for one urgency, for status and whoever else compares urgencies", ""};

bool isDaemonsOwn(std::string_view key) {
  return key == kRecentStats.name || key.starts_with(kRecentStatsAtUrgency.name);
}

std::optional<std::string> objectionToBoolean(std::string_view key, const Value& value) {
  if (value.boolean() != nullptr) return std::nullopt;
  return fmt::format("{} is true or false, not {}", key, kindText(value));
}

/// The daemon's own check, so that the two never differ.
std::optional<std::string> objectionToThreshold(std::string_view key, const Value& value) {
  std::optional<std::string> objection;
  Dictionary state;
  state.set(key, value);
  (void)lowSpaceSettingsFrom(state,
                             [&objection](const std::string& problem) { objection = problem; });
  return objection;
}

}  // namespace

std::span<const KnownKey> settableKeys() { return kSettable; }

const KnownKey* knownKey(std::string_view name) {
  if (name == kRecentStats.name) return &kRecentStats;
  if (isDaemonsOwn(name)) return &kRecentStatsAtUrgency;
  const auto* found = std::ranges::find(kSettable, name, &KnownKey::name);
  return found == kSettable.end() ? nullptr : found;
}

std::optional<std::string> objectionTo(std::string_view key, const Value& value) {
  if (key == kCacheEnabled || key == kFinishEarly) return objectionToBoolean(key, value);
  if (isDaemonsOwn(key)) {
    return fmt::format("{} is the daemon's own record of recent answers", key);
  }
  if (key == kWholeStateKey) {
    return fmt::format("{} names the whole state; a value there could not be read back", key);
  }
  return objectionToThreshold(key, value);
}

std::string printValueOf(std::string_view key, const Value& value) {
  const KnownKey* known = knownKey(key);
  const std::string text = printStateValue(value);
  if (known == nullptr || !known->is_bytes || !value.isNumber()) return text;
  return fmt::format("{} ({})", text, printSize(value.asUnsigned().value_or(0)));
}

}  // namespace spacekeep::ctl
