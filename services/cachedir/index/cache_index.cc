#include "services/cachedir/index/cache_index.h"

#include <algorithm>
#include <limits>

#include "services/cachedir/engine/elapsed.h"
#include "services/cachedir/index/file_systems.h"
#include "support/runtime/locks.h"

namespace spacekeep::cachedir {
namespace {

// A tree in which something moves each time it is looked at is walked in the end.
constexpr int kMaxRounds = 4;
constexpr std::uint64_t kNoLimitNs = std::numeric_limits<std::uint64_t>::max();

}  // namespace

std::optional<CacheIndex::Use> CacheIndex::acquire(std::uint64_t wait_ns) {
  const std::uint64_t deadline = rt::deadlineAfterNs(wait_ns);
  const std::unique_lock lock(mutex_);
  while (busy_) {
    if (!changed_.waitUntil(mutex_, deadline) && busy_) return std::nullopt;
  }
  busy_ = true;
  return Use(this);
}

void CacheIndex::giveBack() {
  const std::scoped_lock lock(mutex_);
  busy_ = false;
  changed_.notifyOne();
}

RootIndex& CacheIndex::of(const Root& root) {
  const auto number = static_cast<std::uint32_t>(indexes_.size());
  const auto [known, fresh] = numbers_.try_emplace(root.rule->path, number);
  if (fresh) {
    indexes_.push_back(std::make_unique<RootIndex>(number, inbox_, settings_.bounds, totals_));
  }
  return *indexes_[known->second];
}

void CacheIndex::resetAll() {
  ++history_.losses;
  for (const auto& index : indexes_) {
    if (index->state() == RootIndex::State::kReady) index->reset();
  }
}

/// What is known of a directory says nothing of another one in its place, of one over which
/// something was mounted, or after too long a time.
void CacheIndex::forgetWhatIsOther(const std::vector<Root>& roots, Effort effort,
                                   const CancelToken& cancel) {
  for (const Root& root : roots) {
    RootIndex& index = of(root);
    if (!index.isOf(root, mountsBelow(root.rule->path))) index.reset();
    if (index.state() != RootIndex::State::kReady) continue;
    if (index.sinceVerifiedNs() <= settings_.trust_ns) continue;
    if (effort == Effort::kBuild) {
      static_cast<void>(index.verify(root, kNoLimitNs, cancel));
    } else {
      index.reset();
    }
  }
}

/// Whether another round is due.
bool CacheIndex::playRound(const std::vector<Root>& roots, Effort effort,
                           const CancelToken& cancel) {
  std::vector<bool> wanted(indexes_.size(), false);
  for (const Root& root : roots) wanted[numbers_.at(root.rule->path)] = true;
  EventInbox::Taken taken = inbox_.take(wanted);
  if (taken.lost) resetAll();
  std::map<std::uint32_t, std::vector<Changed>> changes;
  for (Changed& each : taken.changed) changes[each.owner.root].push_back(std::move(each));
  bool again = false;
  std::vector<std::uint64_t> shared;
  for (const Root& root : roots) {
    RootIndex& index = of(root);
    if (index.state() == RootIndex::State::kReady) {
      index.apply(root, changes[numbers_.at(root.rule->path)], shared, cancel);
      again = index.takeTorn() || again;
    } else if (index.state() == RootIndex::State::kEmpty && effort == Effort::kBuild) {
      ++history_.built;
      index.build(root, mountsBelow(root.rule->path), cancel);
      again = true;  // what happened meanwhile
    }
  }
  for (const Root& root : roots) {
    for (const std::uint64_t inode : shared) of(root).lookAtInode(root, inode);
  }
  return again;
}

CacheIndex::Refreshed CacheIndex::refresh(const std::vector<Root>& roots, Effort effort,
                                          const CancelToken& cancel) {
  Refreshed refreshed;
  forgetWhatIsOther(roots, effort, cancel);
  bool again = true;
  for (int round = 0; again && round < kMaxRounds && !cancel.cancelled(); ++round) {
    again = playRound(roots, effort, cancel);
  }
  for (const Root& root : roots) {
    RootIndex& index = of(root);
    const bool good = index.state() == RootIndex::State::kReady && !again && !cancel.cancelled();
    refreshed.indexed.push_back(good ? &index : nullptr);
    ++(good ? history_.answered : history_.walked);
    for (std::string& problem : index.takeProblems()) {
      refreshed.problems.push_back(std::move(problem));
    }
  }
  return refreshed;
}

bool CacheIndex::changedMeanwhile(const Root& root, const CancelToken& cancel) {
  std::vector<bool> wanted(indexes_.size(), false);
  wanted[numbers_.at(root.rule->path)] = true;
  const EventInbox::Taken taken = inbox_.take(wanted);
  if (taken.lost) resetAll();
  RootIndex& index = of(root);
  std::vector<std::uint64_t> shared;
  if (index.state() == RootIndex::State::kReady) {
    index.apply(root, taken.changed, shared, cancel);
    for (const std::uint64_t inode : shared) index.lookAtInode(root, inode);
  }
  return taken.lost || !taken.changed.empty();
}

CacheIndex::Verified CacheIndex::verify(const std::vector<Root>& roots, std::uint64_t limit_ns,
                                        const CancelToken& cancel) {
  const std::uint64_t begin = rt::ticks();
  for (const Root& root : roots) {
    if (of(root).state() == RootIndex::State::kUnfit) of(root).reset();
  }
  Refreshed refreshed = refresh(roots, Effort::kBuild, cancel);
  Verified verified;
  verified.problems = std::move(refreshed.problems);
  for (std::size_t i = 0; i < roots.size(); ++i) {
    if (refreshed.indexed[i] == nullptr) continue;
    const std::uint64_t used_ns = std::min(elapsedNs(begin), limit_ns);
    const RootIndex::Verified one =
        refreshed.indexed[i]->verify(roots[i], limit_ns - used_ns, cancel);
    verified.whole = verified.whole && one.whole;
    // What changed while it was being compared is no difference.
    if (!changedMeanwhile(roots[i], cancel)) verified.differences += one.differences;
  }
  return verified;
}

}  // namespace spacekeep::cachedir
