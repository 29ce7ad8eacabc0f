#include "support/volumes/linux/linux_volumes.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <algorithm>
#include <fstream>
#include <thread>

#include "tests/helpers/threads/other_process.h"
#include "tests/linux/volumes/volume_world.h"

namespace spacekeep {
namespace {

using test::VolumeWorld;

constexpr std::uint64_t kMiB = 1024 * 1024;

bool holds(const std::vector<std::string>& volumes, const std::string& volume) {
  return std::ranges::find(volumes, volume) != volumes.end();
}

std::uint64_t freeBytes(LinuxVolumes& volumes, const std::string& path) {
  const Value volume(path);
  return volumes.volumeFreespace(&volume);
}

Dictionary request(Value volume) { return {{"SPACEKEEP_VOLUME", std::move(volume)}}; }

/// Waits for what file systems do late, by looking again, for at most half a minute.
bool comesTrue(const std::function<bool()>& condition) {
  for (int i = 0; i < 600; ++i) {
    if (condition()) return true;
    ::sync();
    ::usleep(50'000);
  }
  return false;
}

class OnFileSystem : public ::testing::TestWithParam<const char*> {
 protected:
  VolumeWorld world_;
  LinuxVolumes volumes_;
};

TEST_P(OnFileSystem, AFreshVolumeIsLocalValidAndHasTheSpaceThatStatvfsTells) {
  const std::string path = world_.mountFresh(GetParam(), "v", 400);
  EXPECT_TRUE(holds(volumes_.getLocalVolumes(), path));
  EXPECT_TRUE(volumes_.validateVolume(request(path)));
  struct statvfs status {};
  ASSERT_EQ(::statvfs(path.c_str(), &status), 0);
  EXPECT_EQ(freeBytes(volumes_, path), status.f_bavail * status.f_frsize);
  EXPECT_GT(freeBytes(volumes_, path), 200 * kMiB);
  EXPECT_FALSE(holds(volumes_.lowSpaceVolumes(), path));
}

TEST_P(OnFileSystem, AnUnmountedVolumeIsUnknownAndHasNoSpace) {
  const std::string path = world_.mountFresh(GetParam(), "v", 400);
  ASSERT_TRUE(volumes_.validateVolume(request(path)));
  world_.unmount(path);
  EXPECT_FALSE(volumes_.validateVolume(request(path)));
  EXPECT_EQ(freeBytes(volumes_, path), 0U);
  EXPECT_FALSE(holds(volumes_.getLocalVolumes(), path));
}

TEST_P(OnFileSystem, OneThatIsMountedOverIsNotMeasured) {
  const std::string path = world_.mountFresh(GetParam(), "v", 400);
  ASSERT_EQ(world_.mountFresh("tmpfs", "v", 30), path);
  std::vector<std::uint64_t> sizes;
  for (const VolumeSample& sample : volumes_.sampleLocalVolumes()) {
    if (sample.volume == path) sizes.push_back(sample.space.size_bytes);
  }
  EXPECT_EQ(sizes, std::vector<std::uint64_t>{30 * kMiB});
}

TEST_P(OnFileSystem, OneThatCannotBeReachedAnyMoreIsNotMeasured) {
  const std::string path = world_.mountFresh(GetParam(), "closed/v", 400);
  EXPECT_TRUE(test::holdsInAnotherProcess([&] {
    const bool was_there = holds(volumes_.getLocalVolumes(), path);
    std::filesystem::permissions(world_.directory("closed"), std::filesystem::perms(0700));
    if (!was_there || ::setuid(4711) != 0) return false;
    const auto samples = volumes_.sampleLocalVolumes();
    return std::ranges::find(samples, path, &VolumeSample::volume) == samples.end();
  }));
}

TEST_P(OnFileSystem, WhatIsDeletedCountsAsPurgedOnlyOnceTheBlocksAreBack) {
  const std::string path = world_.mountFresh(GetParam(), "v", 400);
  const std::string file = path + "/cache";
  VolumeWorld::fill(file, 100 * kMiB);
  ASSERT_TRUE(comesTrue([&] { return freeBytes(volumes_, path) < 320 * kMiB; }));
  const int still_open = ::open(file.c_str(), O_RDONLY | O_CLOEXEC);
  ASSERT_GE(still_open, 0);
  Dictionary purge = request(path);
  purge.set("SPACEKEEP_FREESPACE_BEGIN", freeBytes(volumes_, path));

  ASSERT_EQ(::unlink(file.c_str()), 0);
  EXPECT_LT(volumes_.amountPurged(purge), 10 * kMiB) << "the file is still open";
  ::close(still_open);
  EXPECT_TRUE(comesTrue([&] { return volumes_.amountPurged(purge) >= 90 * kMiB; }))
      << volumes_.amountPurged(purge);
}

TEST_P(OnFileSystem, AFullVolumeIsLowAndStaysSoUntilThereIsOneAndAHalfTimesTheThreshold) {
  const std::string path = world_.mountFresh(GetParam(), "v", 400);
  struct statvfs status {};
  ASSERT_EQ(::statvfs(path.c_str(), &status), 0);
  const std::uint64_t low = status.f_blocks * status.f_frsize / 20;
  const std::uint64_t free = freeBytes(volumes_, path);
  // Given back first, as a file of its own: a file system may keep what a shorter file no longer
  // shows.
  VolumeWorld::fill(path + "/slice", low / 4 * 3);
  VolumeWorld::fill(path + "/rest", free - low / 4 * 3 - low / 2);
  ASSERT_TRUE(comesTrue([&] { return freeBytes(volumes_, path) < low; }));
  EXPECT_TRUE(holds(volumes_.lowSpaceVolumes(), path));

  ASSERT_EQ(::unlink((path + "/slice").c_str()), 0);
  ASSERT_TRUE(comesTrue([&] { return freeBytes(volumes_, path) > low; }));
  ASSERT_LT(freeBytes(volumes_, path), low + low / 2);
  EXPECT_TRUE(holds(volumes_.lowSpaceVolumes(), path));
  LinuxVolumes without_memory;
  EXPECT_FALSE(holds(without_memory.lowSpaceVolumes(), path));

  ASSERT_EQ(::unlink((path + "/rest").c_str()), 0);
  EXPECT_TRUE(comesTrue([&] { return !holds(volumes_.lowSpaceVolumes(), path); }));
}

INSTANTIATE_TEST_SUITE_P(Real, OnFileSystem, ::testing::Values("ext4", "xfs", "btrfs", "tmpfs"),
                         [](const auto& instance) { return std::string(instance.param); });

class Volumes : public ::testing::Test {
 protected:
  VolumeWorld world_;
  LinuxVolumes volumes_;
};

TEST_F(Volumes, ARunOutOfInodesIsShort) {
  const std::string path = world_.directory("few");
  VolumeWorld::run("mount -t tmpfs -o size=100M,nr_inodes=100 none " + path);
  EXPECT_FALSE(holds(volumes_.lowSpaceVolumes(), path));
  for (int i = 0; i < 96; ++i) std::ofstream(path + "/" + std::to_string(i)) << "";
  EXPECT_TRUE(holds(volumes_.lowSpaceVolumes(), path));
  EXPECT_GT(freeBytes(volumes_, path), 90 * kMiB);
  ::umount2(path.c_str(), MNT_DETACH);
}

TEST_F(Volumes, NewSettingsDecideWhoIsShortAndAreToldOnce) {
  const std::string path = world_.mountFresh("tmpfs", "v", 100);
  VolumeWorld::fill(path + "/file", 80 * kMiB);
  int told = 0;
  volumes_.setThresholdsChangedHandler([&] { ++told; });
  EXPECT_FALSE(holds(volumes_.lowSpaceVolumes(), path));
  volumes_.setLowSpaceSettings({.percent = 30});
  EXPECT_TRUE(holds(volumes_.lowSpaceVolumes(), path));
  volumes_.setLowSpaceSettings({.percent = 30});
  EXPECT_EQ(told, 1);
  volumes_.setLowSpaceSettings({.bytes = 10 * kMiB, .percent = 30});
  EXPECT_FALSE(holds(volumes_.lowSpaceVolumes(), path));
  EXPECT_EQ(told, 2);
  volumes_.setThresholdsChangedHandler({});
  volumes_.setLowSpaceSettings({});
  EXPECT_EQ(told, 2);
}

TEST_F(Volumes, OnlyTheExactMountPointNamesAVolume) {
  const std::string path = world_.mountFresh("tmpfs", "v", 16);
  ASSERT_TRUE(volumes_.validateVolume(request(path)));
  EXPECT_FALSE(volumes_.validateVolume(request(path + "/")));
  EXPECT_FALSE(volumes_.validateVolume(request(path + "/.")));
  EXPECT_FALSE(volumes_.validateVolume(request("/" + path)));
  EXPECT_FALSE(volumes_.validateVolume(request(path + "/../v")));
  ASSERT_EQ(::mkdir((path + "/inside").c_str(), 0700), 0);
  EXPECT_FALSE(volumes_.validateVolume(request(path + "/inside")));
  EXPECT_FALSE(volumes_.validateVolume(request("")));
  EXPECT_FALSE(volumes_.validateVolume(request(5)));
  EXPECT_FALSE(volumes_.validateVolume(request(Array{path})));
  EXPECT_FALSE(volumes_.validateVolume({}));
  EXPECT_EQ(freeBytes(volumes_, path + "/"), 0U);
  EXPECT_EQ(volumes_.volumeFreespace(nullptr), 0U);
  const Value number(5);
  EXPECT_EQ(volumes_.volumeFreespace(&number), 0U);
}

TEST_F(Volumes, ASecondMountOfAFileSystemIsValidButCountsOnce) {
  const std::string first = world_.mountFresh("ext4", "first", 64);
  const std::string second = world_.directory("second");
  world_.bind(first, second);
  EXPECT_TRUE(holds(volumes_.getLocalVolumes(), first));
  EXPECT_FALSE(holds(volumes_.getLocalVolumes(), second));
  EXPECT_TRUE(volumes_.validateVolume(request(second)));
  EXPECT_EQ(freeBytes(volumes_, first), freeBytes(volumes_, second));
}

TEST_F(Volumes, AFileSystemThatIsShortIsNamedOnceHoweverOftenItIsMounted) {
  const std::string first = world_.mountFresh("tmpfs", "first", 100);
  const std::string second = world_.directory("second");
  world_.bind(first, second);
  VolumeWorld::fill(first + "/file", 97 * kMiB);
  const auto low = volumes_.lowSpaceVolumes();
  EXPECT_EQ(std::ranges::count(low, first), 1);
  EXPECT_FALSE(holds(low, second));
}

TEST_F(Volumes, TwoSubvolumesOfOneBtrfsCountOnce) {
  const std::string first = world_.mountFresh("btrfs", "first", 400);
  VolumeWorld::run("btrfs -q subvolume create " + first + "/sub");
  const std::string second = world_.directory("second");
  VolumeWorld::run("mount -o subvol=sub $(findmnt -no SOURCE " + first + " | sed 's/\\[.*//') " +
                   second);
  const auto local = volumes_.getLocalVolumes();
  EXPECT_TRUE(holds(local, first));
  EXPECT_FALSE(holds(local, second));
  EXPECT_TRUE(volumes_.validateVolume(request(second)));
  ::umount2(second.c_str(), MNT_DETACH);
}

TEST_F(Volumes, AMountedFileIsNoVolume) {
  const std::string volume = world_.mountFresh("tmpfs", "v", 16);
  std::ofstream(volume + "/file") << "x";
  const std::string place = world_.directory("place") + "/file";
  std::ofstream(place.c_str()) << "y";
  world_.bind(volume + "/file", place);
  EXPECT_FALSE(volumes_.validateVolume(request(place)));
  EXPECT_FALSE(holds(volumes_.getLocalVolumes(), place));
}

TEST_F(Volumes, AReadOnlyFileSystemIsNoVolumeButAReadOnlyViewOfAWritableOneIs) {
  const std::string path = world_.mountFresh("ext4", "v", 64);
  ASSERT_EQ(::mount(nullptr, path.c_str(), nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr), 0);
  EXPECT_TRUE(volumes_.validateVolume(request(path)));
  ASSERT_EQ(::mount(nullptr, path.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0);
  EXPECT_FALSE(volumes_.validateVolume(request(path)));
}

TEST_F(Volumes, PseudoFileSystemsAndOverlaysBelowTheRootAreNoVolumes) {
  EXPECT_FALSE(volumes_.validateVolume(request("/proc")));
  EXPECT_FALSE(volumes_.validateVolume(request("/sys")));
  const std::string layers = world_.mountFresh("tmpfs", "layers", 16);
  for (const char* name : {"lower", "upper", "work"}) {
    ASSERT_EQ(::mkdir((layers + "/" + name).c_str(), 0700), 0);
  }
  const std::string place = world_.directory("overlay");
  VolumeWorld::run("mount -t overlay -o lowerdir=" + layers + "/lower,upperdir=" + layers +
                   "/upper,workdir=" + layers + "/work none " + place);
  EXPECT_FALSE(volumes_.validateVolume(request(place)));
  ::umount2(place.c_str(), MNT_DETACH);
}

TEST_F(Volumes, WhatLiesUnderALaterMountIsNotSeen) {
  const std::string lower = world_.mountFresh("tmpfs", "place", 16);
  const std::uint64_t lower_free = freeBytes(volumes_, lower);
  VolumeWorld::run("mount -t tmpfs -o size=8M none " + lower);
  EXPECT_EQ(freeBytes(volumes_, lower), lower_free / 2);
  EXPECT_EQ(std::ranges::count(volumes_.getLocalVolumes(), lower), 1);
  ::umount2(lower.c_str(), MNT_DETACH);
  EXPECT_EQ(freeBytes(volumes_, lower), lower_free);
}

TEST_F(Volumes, TheMountTableIsReadOnlyWhenItHasChanged) {
  (void)volumes_.getLocalVolumes();
  const std::uint64_t readings = volumes_.mountTableReadings();
  for (int i = 0; i < 100; ++i) {
    (void)volumes_.getLocalVolumes();
    (void)volumes_.validateVolume(request("/"));
  }
  EXPECT_EQ(volumes_.mountTableReadings(), readings);
  const std::string path = world_.mountFresh("tmpfs", "new", 16);
  EXPECT_TRUE(volumes_.validateVolume(request(path)));
  EXPECT_EQ(volumes_.mountTableReadings(), readings + 1);
}

TEST_F(Volumes, ManyThreadsAskWhileMountsComeAndGo) {
  std::vector<std::jthread> askers;
  for (int i = 0; i < 3; ++i) {
    askers.emplace_back([this](const std::stop_token& ended) {
      while (!ended.stop_requested()) {
        EXPECT_FALSE(volumes_.getLocalVolumes().empty());
        (void)volumes_.lowSpaceVolumes();
      }
    });
  }
  for (int i = 0; i < 20; ++i) {
    const std::string path = world_.mountFresh("tmpfs", "v", 16);
    EXPECT_EQ(freeBytes(volumes_, path), 16 * kMiB);
    world_.unmount(path);
    EXPECT_EQ(freeBytes(volumes_, path), 0U);
  }
}

TEST(VolumesWithoutATable, ThereAreNoneAndItIsTriedAgain) {
  LinuxVolumes volumes("/nowhere/mountinfo");
  EXPECT_TRUE(volumes.getLocalVolumes().empty());
  EXPECT_TRUE(volumes.lowSpaceVolumes().empty());
  EXPECT_EQ(volumes.mountTableReadings(), 2U);
}

}  // namespace
}  // namespace spacekeep
