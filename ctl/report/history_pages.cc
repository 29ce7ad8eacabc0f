#include "ctl/report/history_pages.h"

#include <utility>

#include "ctl/report/entry.h"
#include "history/history_keys.h"
#include "operations/info_keys.h"

namespace spacekeep::ctl {
namespace {

constexpr int kPageEntries = 1000;

constexpr const char* kNoRight =
    "this user may not see what was freed: that takes \"ITEMIZED_PURGEABLE_ENTITLEMENT\", which "
    "root holds (spacekeepctl doctor tells more)";
constexpr const char* kNotKept =
    "the daemon is older than this tool and keeps no history of what it freed";
constexpr const char* kNoSense = "the daemon answered with a history that does not end";

class Reader {
 public:
  Reader(const WantedHistory& wanted, const AskHistory& ask) : wanted_(wanted), ask_(ask) {}

  History run() {
    while (takePage()) {
    }
    return std::move(history_);
  }

 private:
  /// Answers whether there is an older page to take.
  bool takePage() {
    const sdk::Reply reply = ask_(request());
    if (reply.error) return fail(*reply.error);
    if (!reply.outcome) {
      return stop(History::Access::kRefused, {ExitCode::kRefused, kNoRight});
    }
    const Value* entries = reply.outcome->find(keys::kEntries);
    const bool wanted =
        entries == nullptr || entries->array() == nullptr || take(*entries->array());
    const auto next = unsignedAt(*reply.outcome, keys::kNext);
    if (!wanted || !next) return false;
    if (before_ && *next >= *before_) {
      return stop(History::Access::kFailed, {ExitCode::kFailed, kNoSense});
    }
    before_ = next;
    return true;
  }

  /// Answers whether older entries are wanted.
  bool take(const Array& entries) {
    for (const auto& value : entries) {
      const Dictionary* entry = value.dictionary();
      if (entry == nullptr) continue;
      const auto date_ns = dateOf(*entry);
      if (wanted_.since_ns && date_ns && *date_ns < *wanted_.since_ns) return false;
      history_.older_left_out = history_.entries.size() == kMostEntries;
      if (history_.older_left_out) return false;
      history_.entries.push_back(value);
    }
    return true;
  }

  [[nodiscard]] Dictionary request() const {
    Dictionary request{{keys::kLimit, kPageEntries}};
    if (!wanted_.volume.empty()) request.set(keys::kVolume, wanted_.volume);
    if (before_) request.set(keys::kBefore, *before_);
    return request;
  }

  bool fail(const sdk::Error& error) {
    if (error.kind == sdk::ErrorKind::kNotSupported) {
      return stop(History::Access::kNotKept, {ExitCode::kDone, kNotKept});
    }
    return stop(History::Access::kFailed, {exitCodeOf(error.kind), error.text});
  }

  bool stop(History::Access access, SurveyProblem problem) {
    history_.access = access;
    history_.problem = std::move(problem);
    return false;
  }

  const WantedHistory& wanted_;
  const AskHistory& ask_;
  History history_;
  std::optional<std::uint64_t> before_;  ///< none: the newest page
};

}  // namespace

History readHistory(const WantedHistory& wanted, const AskHistory& ask) {
  return Reader(wanted, ask).run();
}

}  // namespace spacekeep::ctl
