#include "support/volumes/linux/linux_volumes.h"

#include <algorithm>
#include <set>
#include <utility>

namespace spacekeep {
namespace {

const MountEntry* findMount(const std::vector<MountEntry>& mounts, const std::string& volume) {
  const auto found = std::ranges::find(mounts, volume, &MountEntry::mount_point);
  return found == mounts.end() ? nullptr : &*found;
}

/// Of several mounts of one file system the first.
std::vector<MountEntry> eachFileSystemOnce(const std::vector<MountEntry>& mounts) {
  std::set<std::uint64_t> seen;
  std::vector<MountEntry> once;
  for (const MountEntry& mount : mounts) {
    if (seen.insert(fileSystemNumber(mount)).second) once.push_back(mount);
  }
  return once;
}

}  // namespace

std::vector<std::string> LinuxVolumes::getLocalVolumes() {
  std::vector<std::string> volumes;
  for (const MountEntry& mount : eachFileSystemOnce(*table_.current())) {
    volumes.push_back(mount.mount_point);
  }
  return volumes;
}

std::vector<std::string> LinuxVolumes::lowSpaceVolumes() {
  std::vector<std::string> volumes;
  for (const VolumeSample& sample : sampleLocalVolumes()) {
    if (sample.level != SpaceLevel::kEnough) volumes.push_back(sample.volume);
  }
  return volumes;
}

bool LinuxVolumes::validateVolume(const Dictionary& info) {
  const std::string* volume = stringAt(info, "SPACEKEEP_VOLUME");
  return volume != nullptr && findMount(*table_.current(), *volume) != nullptr;
}

std::uint64_t LinuxVolumes::volumeFreespace(const Value* volume) {
  const std::string* path = volume == nullptr ? nullptr : volume->string();
  if (path == nullptr) return 0;
  const auto mounts = table_.current();
  const MountEntry* mount = findMount(*mounts, *path);
  if (mount == nullptr) return 0;
  const auto space = measureSpace(*mount);
  return space ? space->available_bytes : 0;
}

void LinuxVolumes::setLowSpaceSettings(const LowSpaceSettings& settings) {
  if (!memory_.setSettings(settings)) return;
  thresholds_changed_.update([](const std::function<void()>& changed) {
    if (changed) changed();
  });
}

void LinuxVolumes::setThresholdsChangedHandler(std::function<void()> changed) {
  thresholds_changed_.set(std::move(changed));
}

std::vector<VolumeSample> LinuxVolumes::sampleLocalVolumes() {
  std::vector<VolumeSample> samples;
  for (const MountEntry& mount : eachFileSystemOnce(*table_.current())) {
    const auto space = measureSpace(mount);
    if (!space) continue;
    samples.push_back(
        {.volume = mount.mount_point, .file_system = fileSystemNumber(mount), .space = *space});
  }
  memory_.judge(samples);
  return samples;
}

}  // namespace spacekeep
