#include "services/command/engine/cache_set.h"

#include "support/logging/log.h"
#include "support/runtime/locks.h"

namespace spacekeep::command {
namespace {

constexpr std::uint64_t kLookEveryNs = 20'000'000;  // at whether it is still wanted
constexpr std::size_t kMaxTold = 1024;

}  // namespace

CacheSet::CacheSet(std::vector<Rule> rules, const UserFolders* folders) {
  for (Rule& rule : rules) {
    if (rule.enabled) caches_.push_back(makeCache(std::move(rule), folders));
  }
}

/// That a tool is missing or a program runs is normal: it is noted once, for who wonders.
void CacheSet::keepNews(const Cache& cache, const std::string& note,
                        std::vector<std::string> problems, std::vector<std::string>& into) {
  const std::string& name = cache.rule().name;
  for (const std::string& problem : problems) into.push_back(name + ": " + problem);
  if (note.empty()) return;
  const std::scoped_lock lock(mutex_);
  if (told_.size() < kMaxTold && told_.insert(name + ": " + note).second) {
    logTrace("%s %s: %s", "keepNews", name, note);
  }
}

Offer CacheSet::offer(const std::optional<std::string>& volume, const CancelToken& cancel) {
  Offer sum;
  for (const auto& cache : caches_) {
    if (cancel.cancelled()) break;
    Offer offer = cache->offer(volume, cancel);
    for (std::size_t i = 0; i < kUrgencies; ++i) {
      sum.bytes[i] += offer.bytes[i];
      sum.unknown[i] = sum.unknown[i] || offer.unknown[i];
    }
    keepNews(*cache, offer.note, std::move(offer.problems), sum.problems);
  }
  return sum;
}

bool CacheSet::begin(const CancelToken& cancel) {
  std::unique_lock lock(mutex_);
  while (busy_ && !cancel.cancelled()) {
    changed_.waitUntil(mutex_, rt::deadlineAfterNs(kLookEveryNs));
  }
  if (cancel.cancelled()) return false;
  busy_ = true;
  return true;
}

void CacheSet::end() {
  const std::scoped_lock lock(mutex_);
  busy_ = false;
  changed_.notifyAll();
}

Result CacheSet::free(const Request& request, const CancelToken& cancel, const Visitor& visit) {
  Result sum;
  if (!begin(cancel)) return sum;
  for (const auto& cache : caches_) {
    if (cancel.cancelled() || (!request.periodic && sum.bytes >= request.amount)) break;
    Request part = request;
    part.amount -= request.periodic ? 0 : sum.bytes;
    Result result = cache->free(part, cancel, visit);
    sum.bytes += result.bytes;
    keepNews(*cache, result.note, std::move(result.problems), sum.problems);
  }
  end();
  return sum;
}

}  // namespace spacekeep::command
