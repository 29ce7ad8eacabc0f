// Thread safety: plain values.
//
// How a simulated service behaves, as data: a test writes it down, a scenario draws it at random.
#pragma once

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

#include "support/values/value.h"

namespace spacekeep::sim {

enum class Answer {
  kReplies,
  kRepliesWithoutAmount,  ///< a dictionary without "SPACEKEEP_AMOUNT"
  kRepliesWithText,       ///< "SPACEKEEP_AMOUNT" is a string
  kRepliesNothing,        ///< no dictionary where the interface allows that, else an empty one
  kFailsBeforeCall,       ///< the connection fails as the call arrives; the service never sees it
  kFailsDuringCall,       ///< the service does the work, and the connection fails after the delay
  kNever,                 ///< the call is held, see SimulatedService::answerHeldCalls
};

/// How the connection ends when a call fails.
enum class ConnectionEnd { kInvalidated, kInterrupted };

struct CallBehaviour {
  Answer answer = Answer::kReplies;
  std::uint64_t delay_ns = 0;                ///< from the arrival of the call to its end
  std::uint32_t percent_given = 100;         ///< of the bytes asked for; never more than it owns
  std::uint32_t percent_reported = 100;      ///< of the bytes freed
  std::uint64_t reported_extra = 0;          ///< added to the bytes reported
  std::uint64_t space_returns_after_ns = 0;  ///< from the end of the call to the free space
  ConnectionEnd end = ConnectionEnd::kInvalidated;
};

/// Bytes that may go at an urgency and above, by urgency 1 to 4 (element 0 is unused).
using OwnedBytes = std::array<std::uint64_t, 5>;

struct ServiceBehaviour {
  std::map<std::string, OwnedBytes> owns;  ///< by volume
  /// The n-th purge call is handled as the n-th entry says, later ones as the last entry says.
  std::vector<CallBehaviour> purge = {CallBehaviour{}};
  CallBehaviour purgeable;
  CallBehaviour periodic;
  CallBehaviour ping;
  CallBehaviour cancel;
  CallBehaviour notify;
  /// A cancel ends a held or delayed purge call at once, with what it has freed (nothing).
  bool cancel_stops_purge = false;
  bool answers_twice = false;    ///< each call; the wire takes the first answer only
  std::optional<Value> opt_out;  ///< sent as "SPACEKEEP_OPT_OUT" with each purgeable answer
  std::uint64_t periodic_amount = 0;
};

/// A service that owns `bytes` at urgency 1 on `volume` and always does as it is told.
[[nodiscard]] ServiceBehaviour ownsBytes(const std::string& volume, std::uint64_t bytes);

}  // namespace spacekeep::sim
