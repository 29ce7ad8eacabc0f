#include "services/command/engine/tool_cache.h"

#include <sys/statvfs.h>

#include <algorithm>
#include <set>

#include "services/cachedir/engine/space_return.h"
#include "services/command/engine/in_use.h"
#include "services/command/engine/matches.h"
#include "services/command/engine/measure.h"
#include "services/command/engine/output_amount.h"
#include "support/runtime/runtime.h"

namespace spacekeep::command {
namespace {

using cachedir::OpenedRoots;
using cachedir::Root;

std::uint64_t freeBytesOf(const Root& root) {
  struct statvfs facts {};
  if (::fstatvfs(root.fd.get(), &facts) != 0) return 0;
  return static_cast<std::uint64_t>(facts.f_bavail) * facts.f_frsize;
}

void replaceAll(std::string& text, std::string_view what, const std::string& by) {
  for (std::size_t at = text.find(what); at != std::string::npos;
       at = text.find(what, at + by.size())) {
    text.replace(at, what.size(), by);
  }
}

Words withAmounts(Words words, std::uint64_t amount, std::uint64_t occupied) {
  for (std::string& word : words) {
    replaceAll(word, "{AMOUNT}", std::to_string(amount));
    replaceAll(word, "{KEEP}", std::to_string(occupied - std::min(occupied, amount)));
  }
  return words;
}

bool dependsOnAmount(const Words& words) {
  return std::ranges::any_of(words, [](const std::string& word) {
    return word.find("{AMOUNT}") != std::string::npos || word.find("{KEEP}") != std::string::npos;
  });
}

/// Of all the file systems together.
std::uint64_t freeBytesOn(const std::vector<Root>& roots) {
  std::uint64_t sum = 0;
  std::set<std::uint64_t> seen;
  for (const Root& root : roots) {
    if (seen.insert(root.file_system).second) sum += freeBytesOf(root);
  }
  return sum;
}

bool onOneFileSystem(const std::vector<Root>& roots) {
  return std::ranges::all_of(
      roots, [&](const Root& root) { return root.file_system == roots.front().file_system; });
}

}  // namespace

/// Why none of the tools is here, empty when one is. Its absence is no problem: caches of programs
/// that nobody installed are empty.
std::string CacheOfTool::absence() const {
  std::string missing;
  for (const auto& step : tool().steps) {
    if (!step) continue;
    if (!whereIs(step->command.front()).empty()) return "";
    missing = step->command.front();
  }
  return missing + " is not installed";
}

std::optional<std::uint64_t> CacheOfTool::wouldFree(const CleanStep& step,
                                                    const std::vector<Root>& roots,
                                                    const CancelToken& cancel,
                                                    std::vector<std::string>& problems) const {
  if (const auto* go = std::get_if<FilesThatGo>(&step.preview)) {
    return measureThoseThatGo(roots, *go, rt::wallClockNs(), cancel).bytes;
  }
  const auto* told = std::get_if<ToldByTool>(&step.preview);
  if (told == nullptr) return std::nullopt;
  const ToolRun run = runTool(told->command, environment_, told->limit_ns, cancel);
  if (!run.good()) {
    if (run.end != ToolEnd::kCancelled) problems.push_back(problemOf(told->command, run));
    return std::nullopt;
  }
  if (told->amount.kind == AmountInOutput::Kind::kPaths) {
    return measureBelow(roots, pathsIn(run.output, told->amount.after), cancel).bytes;
  }
  auto amount = amountIn(run.output, told->amount);
  if (!amount) {
    problems.push_back(textOf(told->command) + " printed no amount where the rule looks for one");
    return std::nullopt;
  }
  // A tool may count what others share, or lies elsewhere.
  return std::min(*amount, measure(roots, cancel).bytes);
}

Offer CacheOfTool::offer(const std::optional<std::string>& volume,
                         const CancelToken& cancel) const {
  Offer offer;
  const cachedir::Rules rules = matched(tool().measured);
  OpenedRoots opened = openRoots(rules, volume);
  offer.problems = std::move(opened.problems);
  if (opened.roots.empty()) return offer;
  offer.note = absence();
  if (offer.note.empty()) offer.note = whyNotNow(rule().not_while);
  if (!offer.note.empty()) return offer;
  std::uint64_t so_far = 0;
  bool unknown = false;
  for (std::size_t i = 0; i < kUrgencies; ++i) {
    if (const auto& step = tool().steps[i]) {
      const auto amount = wouldFree(*step, opened.roots, cancel, offer.problems);
      unknown = !amount;
      so_far = std::max(so_far, amount.value_or(0));
    }
    offer.bytes[i] = so_far;
    offer.unknown[i] = unknown;
  }
  return offer;
}

/// One request: the mildest command first, the next only while something is missing.
class CacheOfTool::Cleaning {
 public:
  Cleaning(const CacheOfTool& cache, const Request& request, const CancelToken& cancel,
           const Visitor& visit)
      : cache_(cache),
        request_(request),
        cancel_(cancel),
        visit_(visit),
        rules_(matched(cache.tool().measured)),
        opened_(openRoots(rules_, request.volume)) {
    result_.problems = opened_.problems;
  }

  Result result() {
    if (opened_.roots.empty() || isNotNow()) return std::move(result_);
    const std::uint64_t free_before = freeBytesOn(opened_.roots);
    cachedir::SpaceReturn space(opened_.roots.front().fd.get());
    const Measured before = measure(opened_.roots, cancel_);
    const bool steady = freeBytesOn(opened_.roots) == free_before;
    occupied_ = before.bytes;
    for (int urgency = 1; urgency <= request_.urgency && !satisfied(); ++urgency) {
      const auto& step = cache_.tool().steps[static_cast<std::size_t>(urgency - 1)];
      if (!step) continue;
      // Counting and the command before took their time.
      result_.note = whyNotNow(cache_.rule().not_while);
      if (!result_.note.empty()) break;
      play(*step);
    }
    if (request_.dry_run || result_.bytes == 0) return std::move(result_);
    space.add(result_.bytes);
    space.wait(cancel_);
    if (!whole_ || (steady && onOneFileSystem(opened_.roots))) capByGain(free_before);
    return std::move(result_);
  }

 private:
  bool isNotNow() {
    result_.note = cache_.absence();
    if (result_.note.empty()) result_.note = whyNotNow(cache_.rule().not_while);
    return !result_.note.empty();
  }

  [[nodiscard]] bool satisfied() const {
    return result_.bytes >= request_.amount || cancel_.cancelled();
  }

  void play(const CleanStep& step) {
    const std::uint64_t missing = request_.amount - result_.bytes;
    const Words words = withAmounts(step.command, missing, occupied_);
    std::optional<std::uint64_t> freed;
    if (request_.dry_run) {
      freed = cache_.wouldFree(step, opened_.roots, cancel_, result_.problems);
      if (freed && dependsOnAmount(step.command)) freed = std::min(*freed, request_.amount);
      if (freed) *freed -= std::min(*freed, result_.bytes);  // what milder commands took is in it
    } else {
      const ToolRun run = runTool(words, cache_.environment_, step.limit_ns, cancel_);
      if (!run.good() && run.end != ToolEnd::kCancelled && run.end != ToolEnd::kAbsent) {
        result_.problems.push_back(problemOf(words, run));
      }
      // What has gone has gone, wanted or not: the count after a cancel is made all the same.
      const Measured left = countAgain();
      freed = occupied_ - std::min(occupied_, left.bytes);
      occupied_ = left.bytes;
      whole_ = whole_ && left.whole;
    }
    result_.bytes += freed.value_or(0);
    if (visit_ && freed != std::uint64_t{0}) visit_(textOf(words), freed);
  }

  /// By name and not in what was opened before: a tool may make a directory anew and put it in the
  /// place of the old one, or give it another name of the pattern.
  [[nodiscard]] Measured countAgain() const {
    cachedir::Rules rules = matched(cache_.tool().measured);
    rules.directories.insert(rules.directories.end(), rules_.directories.begin(),
                             rules_.directories.end());
    const OpenedRoots opened = openRoots(rules, request_.volume);
    Measured now = measure(opened.roots, CancelToken());
    now.whole = now.whole && opened.problems.empty();
    return now;
  }

  /// Where the volume stood still before, what it did not gain did not come back. And what could not
  /// be counted may be there still.
  void capByGain(std::uint64_t free_before) {
    const std::uint64_t now = freeBytesOn(opened_.roots);
    result_.bytes = std::min(result_.bytes, now - std::min(now, free_before));
  }

  const CacheOfTool& cache_;
  const Request& request_;
  const CancelToken& cancel_;
  const Visitor& visit_;
  const cachedir::Rules rules_;
  const OpenedRoots opened_;
  std::uint64_t occupied_ = 0;
  bool whole_ = true;  // all that the commands left could be counted
  Result result_;
};

Result CacheOfTool::free(const Request& request, const CancelToken& cancel,
                         const Visitor& visit) const {
  if (request.periodic || request.amount == 0 || request.urgency < 1 ||
      request.urgency > kUrgencies) {
    return {};
  }
  return Cleaning(*this, request, cancel, visit).result();
}

}  // namespace spacekeep::command
