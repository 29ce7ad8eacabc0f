#include "support/volumes/local_mounts.h"

#include <gtest/gtest.h>

namespace spacekeep {
namespace {

MountEntry mount(std::int32_t id, std::int32_t parent, std::string at, std::string type,
                 std::uint32_t major = 0, bool read_only = false) {
  return {.id = id,
          .parent_id = parent,
          .device_major = major,
          .device_minor = static_cast<std::uint32_t>(id),
          .mount_point = std::move(at),
          .type = std::move(type),
          .source = "none",
          .read_only = read_only};
}

std::vector<std::string> volumes(const std::vector<MountEntry>& table) {
  std::vector<std::string> paths;
  for (const MountEntry& each : localMounts(table)) paths.push_back(each.mount_point);
  return paths;
}

using Paths = std::vector<std::string>;

TEST(LocalMounts, WhichFileSystemsAreLocal) {
  struct Case {
    const char* type;
    std::uint32_t major;
    FileSystemKind kind;
  };
  using enum FileSystemKind;
  const Case cases[] = {
      {"ext4", 254, kLocal},   {"xfs", 7, kLocal},          {"vfat", 8, kLocal},
      {"fuseblk", 8, kLocal},  {"btrfs", 0, kLocal},        {"tmpfs", 0, kLocal},
      {"ubifs", 0, kLocal},    {"zfs", 0, kLocal},          {"overlay", 0, kRootLocal},
      {"nfs4", 0, kDistant},   {"cifs", 0, kDistant},       {"autofs", 0, kDistant},
      {"9p", 0, kDistant},     {"fuse.sshfs", 0, kDistant}, {"fuse", 0, kDistant},
      {"ocfs2", 8, kDistant},  {"proc", 0, kPseudo},        {"sysfs", 0, kPseudo},
      {"cgroup2", 0, kPseudo}, {"devtmpfs", 0, kPseudo},    {"something-new", 0, kPseudo},
  };
  for (const Case& each : cases) {
    EXPECT_EQ(kindOf(mount(1, 0, "/x", each.type, each.major)), each.kind) << each.type;
  }
}

TEST(LocalMounts, ATypicalMachineInMountOrder) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/proc", "proc"),
                     mount(3, 1, "/run", "tmpfs"), mount(4, 1, "/data", "xfs", 8),
                     mount(5, 1, "/net", "nfs"), mount(6, 1, "/usr", "squashfs", 7, true)}),
            (Paths{"/", "/run", "/data"}));
}

TEST(LocalMounts, AFolderOfDeviceNodesIsNoVolumeWhenItIsATmpfsButWhatIsMountedInItIs) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/dev", "tmpfs"),
                     mount(3, 2, "/dev/shm", "tmpfs"), mount(4, 1, "/devices", "tmpfs")}),
            (Paths{"/", "/dev/shm", "/devices"}));
}

TEST(LocalMounts, AnOverlayCountsAsTheRootOnly) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "overlay"), mount(2, 1, "/layers", "overlay")}),
            (Paths{"/"}));
}

TEST(LocalMounts, AReadOnlyRootDoesNotCount) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254, true)}), Paths{});
}

TEST(LocalMounts, OfTwoMountsOnOnePlaceTheUpperOneCounts) {
  const auto local = localMounts({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/data", "ext4", 8),
                                  mount(3, 2, "/data", "xfs", 8)});
  ASSERT_EQ(local.size(), 2U);
  EXPECT_EQ(local[1].type, "xfs");
}

TEST(LocalMounts, WhatAPseudoFileSystemCoversIsNoVolume) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/data", "ext4", 8),
                     mount(3, 2, "/data", "proc")}),
            (Paths{"/"}));
}

TEST(LocalMounts, WhatLiesBelowACoveredPlaceIsNoVolume) {
  // /mnt/a was mounted on the root, then /mnt was covered.
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/mnt/a", "ext4", 8),
                     mount(3, 2, "/mnt/a/deep", "ext4", 8), mount(4, 1, "/mnt", "tmpfs")}),
            (Paths{"/", "/mnt"}));
}

TEST(LocalMounts, ALongerNameIsNotBelowAShorterOne) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/mnt2", "ext4", 8),
                     mount(3, 1, "/mnt", "tmpfs")}),
            (Paths{"/", "/mnt2", "/mnt"}));
}

TEST(LocalMounts, ACoveredFirstRootDoesNotCount) {
  // As after the change from the initial ram disk to the real root.
  EXPECT_EQ(volumes({mount(1, 1, "/", "tmpfs"), mount(2, 1, "/", "ext4", 254),
                     mount(3, 2, "/data", "ext4", 8)}),
            (Paths{"/", "/data"}));
  EXPECT_EQ(localMounts({mount(1, 1, "/", "tmpfs"), mount(2, 1, "/", "ext4", 254)})[0].type,
            "ext4");
}

TEST(LocalMounts, WhatIsReachedThroughADistantFileSystemIsNoVolume) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "ext4", 254), mount(2, 1, "/net", "autofs"),
                     mount(3, 2, "/net/host", "nfs"), mount(4, 3, "/net/host/local", "tmpfs"),
                     mount(5, 2, "/net/disk", "ext4", 8)}),
            (Paths{"/"}));
}

TEST(LocalMounts, ADistantRootDoesNotHideTheLocalDisks) {
  EXPECT_EQ(volumes({mount(1, 0, "/", "nfs"), mount(2, 1, "/data", "ext4", 8)}), (Paths{"/data"}));
}

TEST(LocalMounts, ATableWithACircleEnds) {
  EXPECT_EQ(volumes({mount(1, 2, "/a", "tmpfs"), mount(2, 1, "/b", "tmpfs")}), Paths{});
}

TEST(LocalMounts, TheNumberOfAFileSystemIsThatOfItsDevice) {
  const MountEntry first = mount(1, 0, "/a", "ext4", 8);
  MountEntry bound = mount(1, 0, "/b", "ext4", 8);
  EXPECT_EQ(fileSystemNumber(first), fileSystemNumber(bound));
  bound.device_major = 9;
  EXPECT_NE(fileSystemNumber(first), fileSystemNumber(bound));
}

}  // namespace
}  // namespace spacekeep
