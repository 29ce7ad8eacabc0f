#include "ctl/survey.h"

#include <fmt/core.h>

#include <cmath>
#include <cstdint>
#include <utility>

#include "ctl/shown_call.h"
#include "ctl/text_layout.h"
#include "operations/info_keys.h"
#include "support/runtime/runtime.h"

namespace spacekeep::ctl {
namespace {

/// A query waits ten seconds at the very most, and may stand behind another one.
constexpr std::chrono::milliseconds kPatience{25'000};
/// The daemon waits at least this long for somebody who is late.
constexpr double kLateSeconds = 0.14;
constexpr double kSilentSeconds = 1;

constexpr const char* kNoRight =
    "this user may not ask how much could be freed: that takes \"PURGEABLE_ENTITLEMENT\", which "
    "root and the members of the group spacekeep hold (spacekeepctl doctor tells more)";

class Surveyor {
 public:
  Surveyor(sdk::Client& client, const ShowSurvey& show) : client_(client), show_(show) {}

  Survey run(const std::vector<std::string>& volumes) {
    for (const auto& volume : volumes) {
      survey_.volumes.push_back({.volume = volume});
      if (!survey_.problem) surveyVolume(survey_.volumes.back());
    }
    for (const auto& [index, urgency] : late_) {
      if (!survey_.problem) askAgain(survey_.volumes[index], urgency);
    }
    for (auto& offers : survey_.volumes) sortOffers(offers);
    if (!survey_.problem && !right_ && !volumes.empty()) {
      survey_.problem = {ExitCode::kRefused, kNoRight};
    }
    return std::move(survey_);
  }

 private:
  struct Answer {
    sdk::Reply reply;
    bool somebody_was_late = false;
  };

  void surveyVolume(VolumeOffers& offers) {
    const auto first = firstAnswer(offers.volume);
    if (!first) return;
    offers.detail = detailOf(*right_);
    book(offers, 1, *first);
    for (int urgency = 2; urgency <= kUrgencies && !survey_.problem; ++urgency) {
      book(offers, urgency, ask(*right_, offers.volume, urgency));
    }
  }

  /// Finds out, as long as it is not known, what this user may ask. A volume may be refused by
  /// itself: the daemon may see other volumes than this process.
  std::optional<Answer> firstAnswer(const std::string& volume) {
    using sdk::Operation;
    for (const auto operation : {Operation::kItemizedPurgeableSpace, Operation::kPurgeableSpace}) {
      if (right_ && *right_ != operation) continue;
      Answer answer = ask(operation, volume, 1);
      if (survey_.problem) return std::nullopt;
      if (answer.reply.refused()) continue;
      right_ = operation;
      return answer;
    }
    return std::nullopt;
  }

  void book(VolumeOffers& offers, int urgency, const Answer& answer) {
    if (!answer.reply.outcome) return;
    addAnswer(offers, urgency, *answer.reply.outcome);
    if (answer.somebody_was_late) late_.emplace_back(survey_.volumes.size() - 1, urgency);
  }

  /// Whoever was late the first time is in the daemon's memory by now.
  void askAgain(VolumeOffers& offers, int urgency) {
    const Answer answer = ask(*right_, offers.volume, urgency);
    if (!answer.reply.outcome) return;
    addAnswer(offers, urgency, *answer.reply.outcome);
    if (answer.somebody_was_late) offers.somebody_was_late = true;
  }

  Answer ask(sdk::Operation operation, const std::string& volume, int urgency) {
    const Dictionary request{
        {keys::kVolume, volume}, {keys::kUrgency, urgency}, {keys::kExactUrgency, true}};
    const std::uint64_t start_ticks = rt::ticks();
    Answer answer{.reply = callShowing(
                      [&](sdk::Client::ReplyHandler handler) {
                        client_.callAsync(operation, request, std::move(handler), kPatience);
                      },
                      [&](double) { show_(volume, urgency); })};
    answer.somebody_was_late = secondsSince(start_ticks) >= kLateSeconds;
    if (answer.reply.error) survey_.problem = problemOf(*answer.reply.error);
    return answer;
  }

  static SurveyProblem problemOf(const sdk::Error& error) {
    const bool no_right = error.kind == sdk::ErrorKind::kNotAllowed;
    return {exitCodeOf(error.kind),
            error.text + (no_right ? " (spacekeepctl doctor tells how to get it)" : "")};
  }

  static VolumeOffers::Detail detailOf(sdk::Operation right) {
    return right == sdk::Operation::kItemizedPurgeableSpace ? VolumeOffers::Detail::kServices
                                                            : VolumeOffers::Detail::kTotals;
  }

  sdk::Client& client_;
  const ShowSurvey& show_;
  Survey survey_;
  std::optional<sdk::Operation> right_;            ///< none: not known yet
  std::vector<std::pair<std::size_t, int>> late_;  ///< volume, urgency
};

}  // namespace

Survey surveyOffers(sdk::Client& client, const std::vector<std::string>& volumes,
                    const ShowSurvey& show) {
  return Surveyor(client, show).run(volumes);
}

std::optional<std::string> surveyProgressText(const std::string& volume, int urgency,
                                              double elapsed_seconds) {
  if (elapsed_seconds < kSilentSeconds) return std::nullopt;
  return fmt::format("{:.0f} s, asking the services about {} (urgency {} of {})",
                     std::floor(elapsed_seconds), harmless(volume), urgency, kUrgencies);
}

}  // namespace spacekeep::ctl
