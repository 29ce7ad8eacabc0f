#include "tests/programs/bad_services/fault.h"

#include <utility>

namespace bad_services {
namespace {

constexpr std::pair<std::string_view, Fault> kNames[] = {
    {"none", Fault::kNone},
    {"silent-ping", Fault::kSilentPing},
    {"frees-on-query", Fault::kFreesOnQuery},
    {"boasts-at-first", Fault::kBoastsAtFirst},
    {"offers-less-at-higher-urgency", Fault::kOffersLessAtHigherUrgency},
    {"offers-on-every-volume", Fault::kOffersOnEveryVolume},
    {"silent-notify", Fault::kSilentNotify},
    {"drops-what-comes-together", Fault::kDropsWhatComesTogether},
    {"dies-of-odd-requests", Fault::kDiesOfOddRequests},
    {"leaks-descriptors", Fault::kLeaksDescriptors},
    {"leaks-memory", Fault::kLeaksMemory},
    {"frees-for-nothing", Fault::kFreesForNothing},
    {"frees-for-every-volume", Fault::kFreesForEveryVolume},
    {"stingy", Fault::kStingy},
    {"greedy", Fault::kGreedy},
    {"ignores-cancel", Fault::kIgnoresCancel},
    {"silent-after-cancel", Fault::kSilentAfterCancel},
    {"dies-with-the-daemon", Fault::kDiesWithTheDaemon},
    {"never-comes-back", Fault::kNeverComesBack},
    {"keeps-some", Fault::kKeepsSome},
    {"takes-files-in-use", Fault::kTakesFilesInUse},
    {"silent-purge", Fault::kSilentPurge},
    {"fails-purges", Fault::kFailsPurges},
    {"answers-twice", Fault::kAnswersTwice},
    {"answers-with-text", Fault::kAnswersWithText},
    {"lies", Fault::kLies},
    {"slow", Fault::kSlow},
    {"ends-at-once", Fault::kEndsAtOnce},
};

}  // namespace

std::optional<Fault> faultNamed(std::string_view name) {
  for (const auto& [known, fault] : kNames) {
    if (known == name) return fault;
  }
  return std::nullopt;
}

}  // namespace bad_services
