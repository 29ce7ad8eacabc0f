#include "services/command/engine/measure.h"

#include <fcntl.h>
#include <fnmatch.h>
#include <sys/stat.h>

#include <algorithm>

#include "services/cachedir/engine/link_groups.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/command/engine/file_age.h"

namespace spacekeep::command {
namespace {

using cachedir::FoundFile;
using cachedir::Root;
using Wanted = std::function<bool(const FoundFile&)>;

Measured measureIf(const std::vector<Root>& roots, const Wanted& wanted,
                   const cachedir::CancelToken& cancel) {
  Measured sum;
  cachedir::LinkGroups groups;
  cachedir::Tally tally;
  const auto add = [&sum](std::uint64_t bytes) {
    sum.bytes += bytes;
    ++sum.files;
  };
  const auto visit = [&](const FoundFile& found) {
    if (!wanted(found)) return;
    if (found.links == 1) return add(found.bytes);
    if (const auto group = groups.offer(found, 0)) add(group->bytes);
  };
  sum.whole = cachedir::TreeWalk(roots).forEachFile(visit, cancel, tally) && tally.empty();
  return sum;
}

bool matchesOne(const std::vector<std::string>& patterns, const std::string& name) {
  return std::ranges::any_of(patterns, [&name](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), name.c_str(), 0) == 0;
  });
}

/// Access does not count here: tools go by when a file was written.
std::optional<std::int64_t> modifiedNs(const FoundFile& found, const Root& root) {
  const std::string path = cachedir::joined(found.folder->path, found.name);
  struct stat facts {};
  if (::fstatat(root.fd.get(), path.c_str(), &facts, AT_SYMLINK_NOFOLLOW) != 0) return std::nullopt;
  return cachedir::nsOf(facts.st_mtim);
}

std::optional<std::int64_t> timeNs(const FoundFile& found, const Root& root, FilesThatGo::Age age) {
  const auto modified_ns = modifiedNs(found, root);
  switch (age) {
    case FilesThatGo::Age::kModified:
      return modified_ns;
    case FilesThatGo::Age::kJournalName:
      return modified_ns ? journalTimeNs(found.name, *modified_ns) : std::nullopt;
    case FilesThatGo::Age::kTrashRecord:
      return trashTimeNs(root.fd.get(), cachedir::joined(found.folder->path, found.name));
  }
  return std::nullopt;
}

}  // namespace

Measured measure(const std::vector<Root>& roots, const cachedir::CancelToken& cancel) {
  return measureIf(
      roots, [](const FoundFile&) { return true; }, cancel);
}

Measured measureThoseThatGo(const std::vector<Root>& roots, const FilesThatGo& go,
                            std::int64_t now_ns, const cachedir::CancelToken& cancel) {
  const std::int64_t latest_ns = now_ns - go.older_seconds * cachedir::kNsPerSecond;
  const auto oldEnough = [&](const FoundFile& found) {
    const auto time_ns = timeNs(found, roots[found.folder->root], go.age);
    return time_ns && *time_ns < latest_ns;
  };
  return measureIf(
      roots,
      [&](const FoundFile& found) {
        const std::string name(found.name);
        if (!go.patterns.empty() && !matchesOne(go.patterns, name)) return false;
        if (matchesOne(go.keep, name)) return false;
        return (go.older_seconds == 0 && go.age == FilesThatGo::Age::kModified) || oldEnough(found);
      },
      cancel);
}

Measured measureBelow(const std::vector<Root>& roots, const std::set<std::string>& paths,
                      const cachedir::CancelToken& cancel) {
  return measureIf(
      roots,
      [&](const FoundFile& found) {
        std::string path = roots[found.folder->root].rule->path + "/" +
                           cachedir::joined(found.folder->path, found.name);
        // The file itself, and then each directory above it.
        for (std::size_t end = path.size(); end != std::string::npos && end > 0;
             end = path.rfind('/')) {
          path.resize(end);
          if (paths.contains(path)) return true;
        }
        return false;
      },
      cancel);
}

}  // namespace spacekeep::command
