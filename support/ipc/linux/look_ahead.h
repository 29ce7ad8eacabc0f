// Thread safety: a pure function over a socket that only the calling thread reads.
//
// What stands next in a socket, judged before sd-bus reads it: how long the message is, whether it
// brings descriptors, and whether it may be read at all.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "support/ipc/linux/wire_header.h"

namespace spacekeep::ipc {

inline constexpr const char* kBrokerName = "org.freedesktop.DBus";

/// Who speaks over the connection.
enum class Traffic {
  kOfOnePeer,  ///< what is wrong with its messages costs it the connection
  /// The broker at the other end passes on what anybody sends. A message that cannot be taken is left
  /// out, and descriptors are taken from the broker's own answers only.
  kOfABus,
};

/// Who may send descriptors to this side over a connection of one peer.
enum class DescriptorsFrom {
  kNobody,   ///< what brings some is refused
  kCalls,    ///< each message that brings some is judged as a whole
  kAnybody,  ///< sd-bus takes them, the peer is trusted
};

struct LookAheadRules {
  Traffic traffic = Traffic::kOfOnePeer;
  DescriptorsFrom descriptors = DescriptorsFrom::kNobody;
  std::size_t message_bytes = 0;  ///< longer ones are refused, or left out over a bus
};

/// A message of a bus that was left out.
struct LeftOut {
  std::optional<WireHeader> header;  ///< none when it makes no sense or is too long
  std::uint64_t bytes = 0;
  bool brings_descriptors = false;
};

struct NextMessage {
  enum class Kind {
    kNothing,      ///< nothing is there
    kPeerLeft,     ///< and nothing follows
    kIncomplete,   ///< a part of what is needed to judge it
    kRefused,      ///< the peer is to be cut off
    kMessage,      ///< it has arrived or will, and may be read
    kDescriptors,  ///< so, with descriptors
    kLeftOut,      ///< it is to be passed over
  };
  Kind kind = Kind::kNothing;
  std::uint64_t bytes = 0;  ///< of the message; 0 while that is not known
  std::string problem;      ///< why it is refused
  LeftOut left_out;
};

/// Takes nothing from the socket, and never waits.
[[nodiscard]] NextMessage lookAhead(int socket, const LookAheadRules& rules);

}  // namespace spacekeep::ipc
