// Thread safety: pure function.
//
// What is wrong with a service.
#pragma once

#include <optional>
#include <string_view>

namespace bad_services {

enum class Fault {
  kNone,
  kSilentPing,
  kFreesOnQuery,
  kBoastsAtFirst,
  kOffersLessAtHigherUrgency,
  kOffersOnEveryVolume,
  kSilentNotify,
  kDropsWhatComesTogether,
  kDiesOfOddRequests,
  kLeaksDescriptors,
  kLeaksMemory,
  kFreesForNothing,
  kFreesForEveryVolume,
  kStingy,
  kGreedy,
  kIgnoresCancel,
  kSilentAfterCancel,
  kDiesWithTheDaemon,
  kNeverComesBack,
  kKeepsSome,
  kTakesFilesInUse,
  kSilentPurge,
  kFailsPurges,
  kAnswersTwice,
  kAnswersWithText,
  kLies,
  kSlow,
  kEndsAtOnce,
};

/// From its name on the command line.
[[nodiscard]] std::optional<Fault> faultNamed(std::string_view name);

}  // namespace bad_services
