#include "services/command/engine/whole_directories.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <limits>
#include <set>

#include "services/cachedir/engine/ages.h"
#include "services/cachedir/engine/beneath.h"
#include "services/cachedir/engine/link_groups.h"
#include "services/cachedir/engine/remover.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/engine/space_return.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/command/base/path_patterns.h"
#include "services/command/engine/left_overs.h"
#include "services/command/engine/lived_in.h"
#include "services/command/engine/opt_out.h"
#include "services/command/engine/remove_tree.h"
#include "support/runtime/runtime.h"

namespace spacekeep::command {
namespace {

using cachedir::Root;

constexpr std::uint64_t kScanKeptNs = 1'000'000'000;

/// One directory and what a look at it told.
struct Unit {
  const cachedir::DirectoryRule* rule = nullptr;
  std::int64_t used_ns = 0;  // wall clock, of its youngest file
  std::uint64_t bytes = 0;
  bool in_use = false;
  bool whole = true;  // everything in it could be looked at
};

Unit look(const std::vector<Root>& roots, std::size_t index, const cachedir::OpenFiles& open_files,
          const CancelToken& cancel) {
  Unit unit{.rule = roots[index].rule};
  cachedir::LinkGroups groups;
  cachedir::Tally tally;
  const auto visit = [&](const cachedir::FoundFile& found) {
    unit.used_ns = std::max(unit.used_ns, found.used_ns);
    unit.in_use = unit.in_use || open_files.holds(found.inode, roots[index].file_system);
    if (found.links == 1) {
      unit.bytes += found.bytes;
    } else if (const auto group = groups.offer(found, 0)) {
      unit.bytes += group->bytes;
    }
  };
  unit.whole = cachedir::TreeWalk(roots).walkRoot(index, visit, cancel, tally) &&
               std::ranges::all_of(tally.counts, [](std::uint64_t count) { return count == 0; });
  return unit;
}

/// What others have to do with directories, whatever their files tell.
struct Others {
  std::set<std::string> mounts = mountPoints();
  std::set<cachedir::Inode> held = heldDirectories();
};

bool isLivedIn(const Root& root, const Others& others) {
  return isAnyWithin(others.mounts, root.rule->path) || hasSignOfLife(root.fd.get(), others.held);
}

/// All that could go, with what they were found by.
struct Units {
  cachedir::OpenedRoots opened;
  std::vector<Unit> units;
  std::vector<std::string> problems;
};

Units unitsOf(const cachedir::Rules& rules, const std::optional<std::string>& volume,
              const CancelToken& cancel) {
  Units found;
  found.opened = openRoots(rules, volume);
  found.problems = found.opened.problems;
  cachedir::OpenFiles open_files;
  const auto& roots = found.opened.roots;
  if (roots.empty() || !open_files.scan(roots, cancel)) return found;
  const Others others;
  for (std::size_t i = 0; i < roots.size() && !cancel.cancelled(); ++i) {
    Unit unit = look(roots, i, open_files, cancel);
    if (unit.bytes == 0 || !unit.whole || unit.in_use || isLivedIn(roots[i], others)) continue;
    found.units.push_back(unit);
  }
  return found;
}

std::string folderOf(const std::string& path) { return path.substr(0, path.rfind('/')); }
std::string nameOf(const std::string& path) { return path.substr(path.rfind('/') + 1); }

/// Where directories are renamed and removed. Its path may come to lead elsewhere; the descriptor
/// does not.
struct Place {
  explicit Place(const std::string& folder)
      : path(folder), fd(cachedir::openDirectoryWithoutLinks(folder.empty() ? "/" : folder)) {}

  [[nodiscard]] bool rename(const std::string& from, const std::string& to) const {
    return ::renameat2(fd.get(), from.c_str(), fd.get(), to.c_str(), RENAME_NOREPLACE) == 0;
  }

  std::string path;
  cachedir::UniqueFd fd;
};

/// What a directory must be to go.
struct Terms {
  std::optional<std::string> volume = {};  // a mount point; absent means any
  /// Nothing in it was used later.
  std::int64_t latest_ns = std::numeric_limits<std::int64_t>::max();
};

/// Whether every single file could go now, by the checks that come right before a deletion.
struct Checked {
  bool all = false;
  std::uint64_t bytes = 0;  // that would come back
};

/// What was seen when the directory was chosen may be long ago: all of it is looked at again.
class Check {
 public:
  Check(const Place& place, const std::string& name, const Terms& terms,
        cachedir::OpenFiles& open_files, const CancelToken& cancel)
      : latest_ns_(terms.latest_ns), cancel_(cancel), open_files_(open_files) {
    rules_.directories.push_back({.path = place.path + "/" + name});
    opened_ = openRoots(rules_, terms.volume);
    std::erase_if(opened_.roots, [&](const Root& root) {
      struct stat facts {};
      return ::fstatat(place.fd.get(), name.c_str(), &facts, AT_SYMLINK_NOFOLLOW) != 0 ||
             cachedir::inodeOf(facts) != root.inode;
    });
  }

  /// It is there, and on the volume.
  [[nodiscard]] bool takesPart() const { return !opened_.roots.empty(); }

  Checked result() {
    if (opened_.roots.empty() || !open_files_.ensure(opened_.roots, kScanKeptNs, cancel_))
      return {};
    const Found found = find();
    if (!whole_ || youngest_ns_ > latest_ns_) return {};
    // Whoever has a file may have opened it by a name elsewhere.
    if (!bytesOf(found.names, true)) return {};
    const std::optional<std::uint64_t> bytes = bytesOf(found.files, false);
    if (!bytes) return {};
    // Last: who stands in it could make new files while the others were looked at.
    if (isLivedIn(opened_.roots.front(), Others())) return {};
    return {.all = true, .bytes = *bytes};
  }

 private:
  struct Found {
    std::vector<cachedir::Candidate> files;  // with all their names
    std::vector<cachedir::Candidate> names;  // of files that may have others elsewhere
  };

  Found find() {
    Found found;
    cachedir::LinkGroups groups;
    cachedir::Tally tally;
    const auto visit = [&](const cachedir::FoundFile& file) {
      youngest_ns_ = std::max(youngest_ns_, file.used_ns);
      if (file.links == 1) {
        found.files.push_back(cachedir::candidateOf(file, 0));
      } else if (auto group = groups.offer(file, 0)) {
        found.files.push_back(std::move(*group));
      } else {
        found.names.push_back(cachedir::candidateOf(file, 0));
      }
    };
    whole_ = cachedir::TreeWalk(opened_.roots).forEachFile(visit, cancel_, tally) &&
             std::ranges::all_of(tally.counts, [](std::uint64_t count) { return count == 0; });
    return found;
  }

  /// What would come back; none when one of them is in use.
  std::optional<std::uint64_t> bytesOf(const std::vector<cachedir::Candidate>& candidates,
                                       bool single_names) {
    cachedir::Remover remover(opened_.roots, open_files_,
                              {.dry_run = true, .take_empty = true, .single_names = single_names});
    std::uint64_t bytes = 0;
    for (const cachedir::Candidate& candidate : candidates) {
      if (cancel_.cancelled()) return std::nullopt;
      const auto outcome = remover.take(candidate, cancel_);
      const auto* removal = std::get_if<cachedir::Removal>(&outcome);
      if (removal == nullptr) return std::nullopt;
      bytes += removal->bytes;
    }
    return bytes;
  }

  const std::int64_t latest_ns_;
  const CancelToken& cancel_;
  cachedir::OpenFiles& open_files_;
  cachedir::Rules rules_;
  cachedir::OpenedRoots opened_;
  std::int64_t youngest_ns_ = std::numeric_limits<std::int64_t>::min();
  bool whole_ = false;
};

/// One request's removing of directories.
class Removing {
 public:
  Removing(const std::optional<std::string>& volume, cachedir::OpenFiles& open_files,
           const CancelToken& cancel, std::vector<std::string>& problems)
      : volume_(volume), open_files_(open_files), cancel_(cancel), problems_(problems) {}

  /// The bytes that come back, 0 when it is in use after all. After a cancel the rest waits for the
  /// next request, under a name that nobody looks for.
  std::uint64_t remove(const Unit& unit) {
    const std::string& path = unit.rule->path;
    const std::string name = nameOf(path);
    const std::string going = kGoingPrefix + name;
    const Place place(folderOf(path));
    if (!place.fd || !place.rename(name, going)) {
      problems_.push_back(path + ": cannot be renamed: " + cachedir::errnoText(errno));
      return 0;
    }
    const Terms terms{.latest_ns = unit.used_ns};
    const Checked checked = Check(place, going, terms, open_files_, cancel_).result();
    if (checked.all && place.rename(going, kHalfPrefix + name)) {
      return removeHalf(place, name);
    }
    if (checked.all) problems_.push_back(path + ": what is left of an earlier one is in the way");
    if (!place.rename(going, name)) {
      problems_.push_back(path + ": in use, and made anew meanwhile; the old one is " + place.path +
                          "/" + going);
    }
    return 0;
  }

  /// What a cancel or a crash left where directories of these patterns stand: they themselves may
  /// all be gone.
  std::uint64_t finishOldWork(const cachedir::Rules& patterns) {
    std::uint64_t freed = 0;
    for (const cachedir::DirectoryRule& rule : patterns.directories) {
      for (const std::string& folder : matchesOf(folderOf(rule.path))) {
        const Place place(folder);
        if (place.fd) freed += finishIn(place, rule);
      }
    }
    return freed;
  }

  /// Until the file system shows what was freed.
  void waitForSpace() {
    if (space_) space_->wait(cancel_);
  }

 private:
  std::uint64_t finishIn(const Place& place, const cachedir::DirectoryRule& rule) {
    std::uint64_t freed = 0;
    for (const LeftOver& left : leftOversIn(place.fd.get(), nameOf(rule.path))) {
      if (cancel_.cancelled()) break;
      freed += finish(place, left, isKept(rule, left.name));
    }
    return freed;
  }

  /// Nobody may have looked at it before the crash, or its name had been taken when it was found in
  /// use. No time of use speaks for it, since nobody looks for it there; all else does.
  std::uint64_t finish(const Place& place, const LeftOver& left, bool kept) {
    const std::string now = left.prefix + left.name;
    Check check(place, now, {.volume = volume_}, open_files_, cancel_);
    if (!check.takesPart()) return 0;
    const bool wanted = !kept && !isOptedOut(place.fd.get(), now);
    const Checked checked = wanted ? check.result() : Checked();
    const bool half = left.prefix == kHalfPrefix;
    if (checked.all && (half || place.rename(now, kHalfPrefix + left.name))) {
      return removeHalf(place, left.name);
    }
    if (!checked.all && !half && !cancel_.cancelled()) {
      static_cast<void>(place.rename(now, left.name));
    }
    return 0;
  }

  std::uint64_t removeHalf(const Place& place, const std::string& name) {
    const std::string half = kHalfPrefix + name;
    if (!space_) space_.emplace(place.fd.get());
    const Removed removed = removeTree(place.fd.get(), half.c_str(), cancel_);
    space_->add(removed.bytes);
    if (!removed.all && !cancel_.cancelled()) {
      problems_.push_back(place.path + "/" + half + ": not all of it could be removed");
    }
    return removed.bytes;
  }

  const std::optional<std::string>& volume_;
  cachedir::OpenFiles& open_files_;
  const CancelToken& cancel_;
  std::vector<std::string>& problems_;
  std::optional<cachedir::SpaceReturn> space_;  // since the first removal
};

}  // namespace

cachedir::Estimate estimateWhole(const cachedir::Rules& rules,
                                 const std::optional<std::string>& volume,
                                 const CancelToken& cancel) {
  cachedir::Estimate sum;
  Units found = unitsOf(rules, volume, cancel);
  sum.problems = std::move(found.problems);
  const std::int64_t now_ns = rt::wallClockNs();
  for (const Unit& unit : found.units) {
    const int mildest = cachedir::mildestUrgency(*unit.rule, unit.used_ns, now_ns);
    for (auto i = static_cast<std::size_t>(mildest - 1); i < kUrgencies; ++i) {
      sum.bytes[i] += unit.bytes;
      ++sum.files[i];
    }
  }
  return sum;
}

WholeResult freeWhole(const cachedir::Rules& rules, const cachedir::Rules& patterns,
                      const cachedir::FreeRequest& request, const CancelToken& cancel,
                      const Visitor& visit) {
  WholeResult result;
  cachedir::OpenFiles open_files;
  Removing removing(request.volume, open_files, cancel, result.problems);
  if (!request.dry_run) result.bytes = removing.finishOldWork(patterns);
  Units found = unitsOf(rules, request.volume, cancel);
  result.problems.insert(result.problems.end(), found.problems.begin(), found.problems.end());
  std::ranges::sort(found.units, {}, [](const Unit& unit) { return unit.used_ns; });
  const std::int64_t now_ns = rt::wallClockNs();
  for (const Unit& unit : found.units) {
    if (result.bytes >= request.amount || cancel.cancelled()) break;
    if (request.cancelled && request.cancelled()) break;
    if (cachedir::mildestUrgency(*unit.rule, unit.used_ns, now_ns) > request.urgency) continue;
    const std::string& path = unit.rule->path;
    std::uint64_t bytes = 0;
    if (request.dry_run) {
      const Terms terms{.latest_ns = unit.used_ns};
      const Place place(folderOf(path));
      const Checked checked = Check(place, nameOf(path), terms, open_files, cancel).result();
      bytes = checked.all ? checked.bytes : 0;
    } else {
      bytes = removing.remove(unit);
    }
    result.bytes += bytes;
    if (visit && bytes > 0) visit(path + "/", bytes);
  }
  removing.waitForSpace();
  return result;
}

}  // namespace spacekeep::command
