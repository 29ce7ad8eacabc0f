// Thread safety: a plain value.
#pragma once

#include <cstdint>
#include <string>

namespace spacekeep::ipc {

/// How a server stands on a message bus.
struct BusOptions {
  std::string socket;  ///< path of the broker's socket
  std::string name;    ///< the well-known name to own
  /// How long it waits after a connection that ended or was refused, each time twice as long.
  std::uint64_t first_pause_ns = 1'000'000'000;
  std::uint64_t longest_pause_ns = 600'000'000'000;
  std::uint64_t settled_ns = 60'000'000'000;  ///< after having the name for so long, anew
};

}  // namespace spacekeep::ipc
