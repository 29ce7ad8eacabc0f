#include "support/volumes/local_mounts.h"

#include <algorithm>
#include <array>
#include <map>
#include <set>

namespace spacekeep {
namespace {

template <std::size_t N>
bool isOneOf(const std::array<std::string_view, N>& list, std::string_view text) {
  return std::ranges::find(list, text) != list.end();
}

// File systems on local storage whose device number is not that of a block device.
constexpr std::array<std::string_view, 6> kLocalWithoutDevice = {"btrfs", "bcachefs", "zfs",
                                                                 "ubifs", "jffs2",    "tmpfs"};
constexpr std::array<std::string_view, 20> kDistantTypes = {
    "autofs", "nfs",      "nfs4",     "cifs",   "smb3",      "smbfs", "9p",
    "afs",    "ceph",     "ncpfs",    "gfs",    "gfs2",      "ocfs2", "lustre",
    "coda",   "orangefs", "virtiofs", "vboxsf", "glusterfs", "beegfs"};

/// `path` lies at or below `ancestor`.
bool isAtOrBelow(std::string_view path, std::string_view ancestor) {
  if (ancestor == "/") return true;
  return path.starts_with(ancestor) &&
         (path.size() == ancestor.size() || path[ancestor.size()] == '/');
}

/// The mounts of a table by their places in the tree.
class MountTree {
 public:
  explicit MountTree(const std::vector<MountEntry>& table) : table_(table) {
    for (std::size_t i = 0; i < table.size(); ++i) {
      index_of_id_.emplace(table[i].id, i);
      children_[table[i].parent_id].push_back(i);
    }
  }

  /// Whether a path walk to the mount point of entry `index` ends at that entry, without entering a
  /// distant file system on its way.
  [[nodiscard]] bool isReachable(std::size_t index) const {
    if (isCoveredOnTop(index)) return false;
    std::set<std::size_t> passed;  // a table read during a change could hold a circle
    for (auto at = index; passed.insert(at).second;) {
      if (isCutOff(at)) return false;
      const auto parent = index_of_id_.find(table_[at].parent_id);
      if (parent == index_of_id_.end() || parent->second == at) return true;
      at = parent->second;
      // A distant root is passed by every path of the machine, the daemon's own program included.
      if (kindOf(table_[at]) == FileSystemKind::kDistant && table_[at].mount_point != "/") {
        return false;
      }
    }
    return false;
  }

 private:
  /// Something is mounted right on its root.
  [[nodiscard]] bool isCoveredOnTop(std::size_t index) const {
    const auto children = children_.find(table_[index].id);
    if (children == children_.end()) return false;
    return std::ranges::any_of(children->second, [&](std::size_t child) {
      return child != index && table_[child].mount_point == table_[index].mount_point;
    });
  }

  /// Another mount on the same parent lies on the way to its mount point.
  [[nodiscard]] bool isCutOff(std::size_t index) const {
    const MountEntry& mount = table_[index];
    if (mount.id == mount.parent_id) return false;  // the first root of all is its own parent
    return std::ranges::any_of(children_.at(mount.parent_id), [&](std::size_t sibling) {
      const std::string& other = table_[sibling].mount_point;
      if (sibling == index || table_[sibling].id == mount.parent_id) return false;
      if (other == mount.mount_point) return sibling > index;
      return isAtOrBelow(mount.mount_point, other);
    });
  }

  const std::vector<MountEntry>& table_;
  std::map<std::int32_t, std::size_t> index_of_id_;
  std::map<std::int32_t, std::vector<std::size_t>> children_;
};

/// Holds device nodes, also where a service manager or a container makes it a tmpfs of a few inodes:
/// one that is always full, and where nobody has anything to give.
constexpr std::string_view kDeviceFolder = "/dev";

bool countsAsVolume(const MountEntry& mount) {
  if (mount.read_only || mount.mount_point == kDeviceFolder) return false;
  const FileSystemKind kind = kindOf(mount);
  return kind == FileSystemKind::kLocal ||
         (kind == FileSystemKind::kRootLocal && mount.mount_point == "/");
}

}  // namespace

FileSystemKind kindOf(const MountEntry& mount) {
  if (isOneOf(kDistantTypes, mount.type)) return FileSystemKind::kDistant;
  if (mount.type == "fuse" || mount.type.starts_with("fuse.")) return FileSystemKind::kDistant;
  if (mount.type == "overlay") return FileSystemKind::kRootLocal;
  // Device numbers with major 0 are handed out to file systems that have no block device.
  if (mount.device_major != 0 || isOneOf(kLocalWithoutDevice, mount.type)) {
    return FileSystemKind::kLocal;
  }
  return FileSystemKind::kPseudo;
}

std::vector<MountEntry> localMounts(const std::vector<MountEntry>& table) {
  const MountTree tree(table);
  std::vector<MountEntry> local;
  for (std::size_t i = 0; i < table.size(); ++i) {
    if (countsAsVolume(table[i]) && tree.isReachable(i)) local.push_back(table[i]);
  }
  return local;
}

std::uint64_t fileSystemNumber(const MountEntry& mount) {
  return (std::uint64_t{mount.device_major} << 32) | mount.device_minor;
}

}  // namespace spacekeep
