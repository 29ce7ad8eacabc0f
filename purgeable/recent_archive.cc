#include "purgeable/recent_archive.h"

#include <string_view>
#include <utility>
#include <variant>

#include "support/values/plist.h"

namespace spacekeep {
namespace {

constexpr std::string_view kFormat = "format";
constexpr std::string_view kFormatName = "SpacekeepRecentInfo";
constexpr std::string_view kVersion = "version";
constexpr std::uint64_t kCurrentVersion = 1;
constexpr std::string_view kVolumes = "volumes";
constexpr std::string_view kFreespace = "freespace";
constexpr std::string_view kTimestamp = "timestamp";
constexpr std::string_view kVolumeName = "volumeName";
constexpr std::string_view kServices = "services";
constexpr std::string_view kAmount = "amount";

// Keys in the order of a dictionary, which makes appending them cheap.
Dictionary archived(const SpacekeepRecentServiceInfo& service) {
  Dictionary archive;
  archive.set(kAmount, service.amount);
  archive.set(kTimestamp, service.timestamp);
  return archive;
}

Dictionary archived(const SpacekeepRecentVolumeInfo& volume) {
  Dictionary services;
  for (const auto& [service_id, service] : volume.services) {
    services.set(service_id, archived(service));
  }
  Dictionary archive;
  archive.set(kFreespace, volume.freespace);
  archive.set(kServices, std::move(services));
  archive.set(kTimestamp, volume.timestamp);
  archive.set(kVolumeName, volume.volumeName);
  return archive;
}

const Dictionary* dictionaryAt(const Dictionary& archive, std::string_view key) {
  const Value* value = archive.find(key);
  return value == nullptr ? nullptr : value->dictionary();
}

// A property list keeps dates as seconds in a double, which is off by less than half of this.
std::optional<Date> dateAt(const Dictionary& archive, std::string_view key) {
  const Value* value = archive.find(key);
  const Date* date = value == nullptr ? nullptr : value->date();
  if (date == nullptr) return std::nullopt;
  const bool overflows = date->unix_ns > INT64_MAX - 500;
  return recentDate(overflows ? date->unix_ns : date->unix_ns + 500);
}

std::optional<SpacekeepRecentServiceInfo> serviceFrom(const Value& value) {
  const Dictionary* archive = value.dictionary();
  if (archive == nullptr) return std::nullopt;
  const Value* amount = archive->find(kAmount);
  const auto timestamp = dateAt(*archive, kTimestamp);
  if (amount == nullptr || !timestamp) return std::nullopt;
  return SpacekeepRecentServiceInfo{*amount, *timestamp};
}

std::optional<SpacekeepRecentVolumeInfo> volumeFrom(const Value& value) {
  const Dictionary* archive = value.dictionary();
  if (archive == nullptr) return std::nullopt;
  const auto freespace = unsignedAt(*archive, kFreespace);
  const auto timestamp = dateAt(*archive, kTimestamp);
  const std::string* name = stringAt(*archive, kVolumeName);
  const Dictionary* services = dictionaryAt(*archive, kServices);
  if (!freespace || !timestamp || name == nullptr || services == nullptr) return std::nullopt;
  SpacekeepRecentVolumeInfo volume{
      .freespace = *freespace, .timestamp = *timestamp, .volumeName = *name};
  for (const auto& [service_id, entry] : *services) {
    auto service = serviceFrom(entry);
    if (!service) return std::nullopt;
    volume.services.emplace_hint(volume.services.end(), service_id, std::move(*service));
  }
  return volume;
}

bool isOfThisFormat(const Dictionary& archive) {
  const std::string* format = stringAt(archive, kFormat);
  return format != nullptr && *format == kFormatName &&
         unsignedAt(archive, kVersion) == kCurrentVersion;
}

}  // namespace

Data archivedRecentInfo(const SpacekeepRecentInfo& record) {
  Dictionary volumes;
  for (const auto& [path, volume] : record.volumes()) volumes.set(path, archived(volume));
  return Data{binaryPlist(Dictionary{{kFormat.data(), kFormatName},
                                     {kVersion.data(), kCurrentVersion},
                                     {kVolumes.data(), std::move(volumes)}})};
}

std::optional<SpacekeepRecentInfo> recentInfoFromArchive(const Data& archive) {
  const auto parsed = parsePlist(archive.bytes);
  const Value* value = std::get_if<Value>(&parsed);
  const Dictionary* document = value == nullptr ? nullptr : value->dictionary();
  if (document == nullptr || !isOfThisFormat(*document)) return std::nullopt;
  const Dictionary* volumes = dictionaryAt(*document, kVolumes);
  if (volumes == nullptr) return std::nullopt;
  SpacekeepRecentInfo::Volumes known;
  for (const auto& [path, entry] : *volumes) {
    auto volume = volumeFrom(entry);
    if (!volume) return std::nullopt;
    known.emplace_hint(known.end(), path, std::move(*volume));
  }
  return SpacekeepRecentInfo(std::move(known));
}

}  // namespace spacekeep
