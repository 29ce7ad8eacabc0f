#include "services/cachedir/engine/cache_cleaner.h"

#include <limits>
#include <map>

#include "services/cachedir/engine/ages.h"
#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/engine/estimator.h"
#include "services/cachedir/engine/link_groups.h"
#include "services/cachedir/engine/remover.h"
#include "services/cachedir/engine/space_return.h"
#include "services/cachedir/engine/tree_walk.h"
#include "services/cachedir/index/cache_index.h"
#include "services/cachedir/index/indexed_files.h"
#include "support/runtime/guarded.h"

namespace spacekeep::cachedir {
namespace {

// Requests follow each other closely when the daemon asks a willing service again.
constexpr std::uint64_t kScanKeptNs = 1000 * kNsPerMs;

}  // namespace

/// One request, from its roots to its result.
class CacheCleaner::Run {
 public:
  Run(CacheCleaner& cleaner, const FreeRequest& request, const TakenVisitor& taken,
      const CancelToken& cancel)
      : request_(request),
        taken_(taken),
        cancel_(cancel),
        bounds_(cleaner.bounds_),
        surroundings_(cleaner.surroundings_),
        open_files_(cleaner.open_files_),
        opened_(openRoots(cleaner.rules_, request.volume)) {}

  FreeResult result() {
    result_.problems = opened_.problems;
    if (!opened_.roots.empty()) work();
    result_.cancelled = cancel_.cancelled();
    return std::move(result_);
  }

 private:
  void work();
  void passes(FileSource& source, Remover& remover);
  bool pass(FileSource& source, Remover& remover, bool first);
  bool collect(FileSource& source, OldestFiles& oldest, bool first);
  void removeOldest(Remover& remover, const std::vector<Candidate>& candidates);
  void book(const Candidate& candidate, const Removal& removal);
  [[nodiscard]] bool satisfied() const {
    return !request_.periodic && result_.bytes >= request_.amount;
  }

  const FreeRequest& request_;
  const TakenVisitor& taken_;
  const CancelToken& cancel_;
  const Bounds bounds_;
  const Surroundings& surroundings_;
  OpenFiles& open_files_;
  const OpenedRoots opened_;
  std::vector<std::int64_t> latest_ns_;           // by root: used later than this stays
  std::map<std::uint64_t, SpaceReturn> returns_;  // by file system
  Turn done_;                                     // everything up to here has been dealt with
  FreeResult result_;
};

void CacheCleaner::Run::work() {
  const std::int64_t now_ns = surroundings_.wall_clock_ns();
  for (const Root& root : opened_.roots) {
    latest_ns_.push_back(request_.periodic
                             ? latestForPeriodic(*root.rule, now_ns)
                             : latestForUrgency(*root.rule, request_.urgency, now_ns));
    if (!request_.dry_run) returns_.try_emplace(root.file_system, root.fd.get());
  }
  if (!open_files_.ensure(opened_.roots, kScanKeptNs, cancel_)) {
    if (!cancel_.cancelled()) {
      result_.problems.push_back("/proc: cannot tell which files are open; nothing was freed");
    }
    return;
  }
  Remover remover(opened_.roots, open_files_, {request_.dry_run, request_.periodic});
  if (surroundings_.index) {
    IndexedFiles files(*surroundings_.index, opened_.roots);
    passes(files, remover);
    for (std::string& each : files.takeProblems()) result_.problems.push_back(std::move(each));
  } else {
    TreeWalk walk(opened_.roots);
    passes(walk, remover);
  }
  for (auto& [file_system, space] : returns_) space.wait(cancel_);
}

void CacheCleaner::Run::passes(FileSource& source, Remover& remover) {
  for (bool first = true; pass(source, remover, first); first = false) {
  }
}

/// Whether another pass could find more.
bool CacheCleaner::Run::pass(FileSource& source, Remover& remover, bool first) {
  OldestFiles oldest(bounds_.max_files, bounds_.max_text_bytes);
  if (!collect(source, oldest, first)) return false;
  const bool more = oldest.overflowed();
  removeOldest(remover, oldest.takeInOrder());
  return more && !satisfied() && !cancel_.cancelled();
}

bool CacheCleaner::Run::collect(FileSource& source, OldestFiles& oldest, bool first) {
  LinkGroups groups;
  Tally repeated;  // later passes meet the same obstacles again
  const auto visit = [&](const FoundFile& found) {
    if (found.used_ns > latest_ns_[found.folder->root]) return;
    if (found.bytes == 0 && !request_.periodic) return;
    if (found.links > 1) {
      auto whole = groups.offer(found, 0);
      if (whole && whole->turn > done_) oldest.offer(std::move(*whole));
      return;
    }
    const Turn turn{found.used_ns, found.inode};
    if (turn > done_ && oldest.wants(turn)) oldest.offer(candidateOf(found, 0));
  };
  const bool whole = source.forEachFile(visit, cancel_, first ? result_.left : repeated);
  if (first && whole) {
    for (std::uint64_t i = 0; i < groups.incomplete(); ++i) result_.left.add(Left::kLinked);
  }
  return whole;
}

void CacheCleaner::Run::removeOldest(Remover& remover, const std::vector<Candidate>& candidates) {
  for (const Candidate& candidate : candidates) {
    if (satisfied() || cancel_.cancelled()) return;
    done_ = candidate.turn;
    const auto outcome = remover.take(candidate, cancel_);
    if (const auto* why = std::get_if<Left>(&outcome)) {
      result_.left.add(*why);
    } else {
      book(candidate, std::get<Removal>(outcome));
    }
  }
}

void CacheCleaner::Run::book(const Candidate& candidate, const Removal& removal) {
  const Root& root = opened_.roots[candidate.first.folder->root];
  result_.bytes += removal.bytes;
  result_.directories += removal.directories;
  ++result_.files;
  const auto space = returns_.find(root.file_system);
  if (space != returns_.end()) space->second.add(removal.bytes);
  if (taken_) {
    taken_({root.rule->path + "/" + joined(candidate.first.folder->path, candidate.first.name),
            removal.bytes});
  }
}

/// Waits for its turn. False when cancelled before it came.
bool CacheCleaner::begin(const CancelToken& cancel) {
  std::unique_lock lock(mutex_);
  // The caller's own question cannot wake us, so it is asked now and then.
  while (busy_ && !cancel.cancelled()) {
    changed_.waitUntil(mutex_, rt::deadlineAfterNs(20 * kNsPerMs));
  }
  if (cancel.cancelled()) return false;
  busy_ = true;
  return true;
}

void CacheCleaner::end() {
  const std::scoped_lock lock(mutex_);
  busy_ = false;
  changed_.notifyAll();
}

void CacheCleaner::cancel() {
  const std::scoped_lock lock(mutex_);
  cancels_.fetch_add(1, std::memory_order_acq_rel);
  changed_.notifyAll();
}

FreeResult CacheCleaner::free(const FreeRequest& request, const TakenVisitor& taken) {
  const bool sensible = request.amount > 0 && request.urgency >= 1 && request.urgency <= kUrgencies;
  if (!request.periodic && !sensible) return {};
  const CancelToken cancel(cancels_, request.cancelled);
  if (!begin(cancel)) {
    FreeResult nothing;
    nothing.cancelled = true;
    return nothing;
  }
  FreeResult result = Run(*this, request, taken, cancel).result();
  end();
  return result;
}

Estimate CacheCleaner::estimate(const std::optional<std::string>& volume,
                                const CancelToken& cancel) const {
  const OpenedRoots opened = openRoots(rules_, volume);
  OpenFiles open_files;
  Estimator estimator(opened.roots, open_files, surroundings_.wall_clock_ns());
  if (opened.roots.empty() || !open_files.scan(opened.roots, cancel)) {
    estimator.sum.cancelled = cancel.cancelled();
  } else {
    estimator.count(surroundings_.index.get(), cancel);
  }
  std::vector<std::string>& problems = estimator.sum.problems;
  problems.insert(problems.begin(), opened.problems.begin(), opened.problems.end());
  return std::move(estimator.sum);
}

std::vector<std::string> CacheCleaner::verifyIndex(const std::optional<std::string>& volume,
                                                   std::uint64_t limit_ns,
                                                   const CancelToken& cancel) {
  if (!surroundings_.index) return {};
  const OpenedRoots opened = openRoots(rules_, volume);
  const auto use = surroundings_.index->acquire(limit_ns);
  if (!use) return {};
  CacheIndex::Verified verified = (*use)->verify(opened.roots, limit_ns, cancel);
  if (verified.differences > 0) {
    verified.problems.push_back("the index was wrong about " +
                                std::to_string(verified.differences) +
                                " names of which no event had told; it is right now");
  }
  return std::move(verified.problems);
}

}  // namespace spacekeep::cachedir
