#include "ctl/report/whole_history.h"

#include <utility>

#include "ctl/report/entry.h"

namespace spacekeep::ctl {
namespace {

constexpr const char* kNoRight =
    "this user may not see what was freed: that takes \"ITEMIZED_PURGEABLE_ENTITLEMENT\", which "
    "root holds (spacekeepctl doctor tells more)";
constexpr const char* kNotKept =
    "the daemon is older than this tool and keeps no history of what it freed";
constexpr const char* kNoSense = "the daemon answered with a history that does not end";

/// Answers whether further entries are wanted. One that is too old is no end: they come by their
/// numbers, and a clock that was wrong for a while leaves dates that do not rise with these.
bool takeEntry(const Dictionary& entry, const WantedHistory& wanted, History& history) {
  const auto date_ns = dateOf(entry);
  if (wanted.since_ns && (!date_ns || *date_ns < *wanted.since_ns)) return true;
  history.older_left_out = history.entries.size() == kMostEntries;
  if (history.older_left_out) return false;
  history.entries.emplace_back(entry);
  return true;
}

void stop(History& history, History::Access access, SurveyProblem problem) {
  history.access = access;
  history.problem = std::move(problem);
}

void fail(History& history, const sdk::Error& error) {
  if (error.kind == sdk::ErrorKind::kNotSupported) {
    return stop(history, History::Access::kNotKept, {ExitCode::kDone, kNotKept});
  }
  stop(history, History::Access::kFailed, {exitCodeOf(error.kind), error.text});
}

}  // namespace

History readHistory(const WantedHistory& wanted, const AskHistory& ask) {
  History history;
  auto end = forEachEntry(wanted.volume, kMostOfOnePage, ask, [&](const Dictionary& entry) {
    return takeEntry(entry, wanted, history);
  });
  if (!end) {
    fail(history, end.error());
  } else if (*end == PagesEnd::kRefused) {
    stop(history, History::Access::kRefused, {ExitCode::kRefused, kNoRight});
  } else if (*end == PagesEnd::kNotOlder) {
    stop(history, History::Access::kFailed, {ExitCode::kFailed, kNoSense});
  }
  return history;
}

}  // namespace spacekeep::ctl
