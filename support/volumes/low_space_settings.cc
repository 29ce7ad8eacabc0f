#include "support/volumes/low_space_settings.h"

#include <cmath>
#include <optional>

#include "support/values/text.h"

namespace spacekeep {
namespace {

/// Values come from clients and may be long; a problem is one line for a person.
constexpr std::size_t kMostTextBytes = 80;

std::string shortTextOf(const Value& value) {
  std::string text = textOf(value);
  if (value.string() != nullptr) text = "\"" + text + "\"";
  if (text.size() <= kMostTextBytes) return text;
  std::size_t end = kMostTextBytes;
  while (end > 0 && (static_cast<unsigned char>(text[end]) & 0xC0) == 0x80) --end;
  return text.substr(0, end) + "...";
}

std::string refusal(const std::string& key, const Value& value, const std::string& allowed,
                    const Value& default_value) {
  return key + " is " + shortTextOf(value) + ", but must be " + allowed + "; the default, " +
         textOf(default_value) + ", holds instead";
}

void readBytes(const Dictionary& state, const RefuseLowSpaceSetting& refuse,
               std::uint64_t& setting) {
  const Value* value = state.find(kLowSpaceBytesKey);
  if (value == nullptr) return;
  const auto bytes = value->asUnsigned();
  if (bytes && *bytes >= kLeastLowSpaceBytes && *bytes <= kMostLowSpaceBytes) {
    setting = *bytes;
    return;
  }
  refuse(refusal(kLowSpaceBytesKey, *value,
                 "a number of bytes from " + std::to_string(kLeastLowSpaceBytes) + " to " +
                     std::to_string(kMostLowSpaceBytes),
                 setting));
}

void readPercent(const char* key, const Dictionary& state, const RefuseLowSpaceSetting& refuse,
                 double& setting) {
  const Value* value = state.find(key);
  if (value == nullptr) return;
  const auto percent = value->asDouble();
  if (percent && std::isfinite(*percent) && *percent >= 0 && *percent <= kMostLowSpacePercent) {
    setting = *percent;
    return;
  }
  refuse(refusal(key, *value, "a number from 0 to 50 (percent)", setting));
}

}  // namespace

LowSpaceSettings lowSpaceSettingsFrom(const Dictionary& state,
                                      const RefuseLowSpaceSetting& refuse) {
  LowSpaceSettings settings;
  readBytes(state, refuse, settings.bytes);
  readPercent(kLowSpacePercentKey, state, refuse, settings.percent);
  readPercent(kLowSpaceInodesPercentKey, state, refuse, settings.inodes_percent);
  return settings;
}

}  // namespace spacekeep
