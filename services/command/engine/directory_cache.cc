#include "services/command/engine/directory_cache.h"

#include <fcntl.h>

#include <iterator>

#include "services/cachedir/engine/cache_cleaner.h"
#include "services/command/engine/in_use.h"
#include "services/command/engine/left_overs.h"
#include "services/command/engine/matches.h"
#include "services/command/engine/measure.h"
#include "services/command/engine/opt_out.h"
#include "services/command/engine/tool_cache.h"
#include "services/command/engine/whole_directories.h"

namespace spacekeep::command {
namespace {

/// What the patterns match now, without what its owner keeps.
cachedir::Rules filesWanted(const DirectoryCaches& caches) {
  cachedir::Rules found = matched(caches).files;
  std::erase_if(found.directories,
                [](const auto& rule) { return isOptedOut(AT_FDCWD, rule.path); });
  return found;
}

/// The same; KEEP of such a rule speaks of the directories themselves.
cachedir::Rules wholeWanted(const DirectoryCaches& caches) {
  cachedir::Rules found = matched(caches).whole;
  std::erase_if(found.directories, [](const auto& rule) {
    const std::string name = rule.path.substr(rule.path.rfind('/') + 1);
    return isOptedOut(AT_FDCWD, rule.path) || isKept(rule, name) || isLeftOver(name);
  });
  for (auto& rule : found.directories) rule.keep.clear();
  return found;
}

void append(std::vector<std::string>& to, std::vector<std::string> from) {
  to.insert(to.end(), std::make_move_iterator(from.begin()), std::make_move_iterator(from.end()));
}

}  // namespace

Offer CacheOfDirectories::offer(const std::optional<std::string>& volume,
                                const CancelToken& cancel) const {
  Offer offer;
  offer.note = whyNotNow(rule().not_while);
  if (offer.note.empty()) offer.note = whoHolds(rule().locks);
  if (!offer.note.empty()) return offer;
  const cachedir::CacheCleaner cleaner(filesWanted(caches()));
  const cachedir::Estimate files = cleaner.estimate(volume, cancel);
  const cachedir::Estimate whole = estimateWhole(wholeWanted(caches()), volume, cancel);
  for (std::size_t i = 0; i < kUrgencies; ++i) offer.bytes[i] = files.bytes[i] + whole.bytes[i];
  offer.problems = files.problems;
  append(offer.problems, whole.problems);
  return offer;
}

Result CacheOfDirectories::free(const Request& request, const CancelToken& cancel,
                                const Visitor& visit) const {
  const bool sensible = request.amount > 0 && request.urgency >= 1 && request.urgency <= kUrgencies;
  if (!request.periodic && !sensible) return {};
  Result result;
  result.note = whyNotNow(rule().not_while);
  HeldLocks locks;
  if (result.note.empty()) {
    result.note = request.dry_run ? whoHolds(rule().locks) : locks.take(rule().locks);
  }
  if (!result.note.empty()) return result;
  ConditionWatch watch(rule().not_while, ask_every_ns_);
  cachedir::FreeRequest wish{.amount = request.amount,
                             .urgency = request.urgency,
                             .periodic = request.periodic,
                             .volume = request.volume,
                             .dry_run = request.dry_run,
                             .cancelled = [&] { return cancel.cancelled() || watch.holds(); }};
  cachedir::CacheCleaner cleaner(filesWanted(caches()));
  cachedir::FreeResult files = cleaner.free(wish, [&visit](const cachedir::TakenFile& file) {
    if (visit) visit(file.path, file.bytes);
  });
  result.bytes = files.bytes;
  append(result.problems, std::move(files.problems));
  result.note = watch.why();
  if (request.periodic || result.bytes >= request.amount || cancel.cancelled() ||
      !result.note.empty()) {
    return result;
  }
  wish.amount -= result.bytes;
  WholeResult whole = freeWhole(wholeWanted(caches()), caches().whole, wish, cancel, visit);
  result.bytes += whole.bytes;
  append(result.problems, std::move(whole.problems));
  result.note = watch.why();
  return result;
}

std::unique_ptr<Cache> makeCache(Rule rule, const UserFolders* folders) {
  if (std::holds_alternative<ToolCache>(rule.cache)) {
    return std::make_unique<CacheOfTool>(std::move(rule), folders);
  }
  return std::make_unique<CacheOfDirectories>(std::move(rule));
}

}  // namespace spacekeep::command
