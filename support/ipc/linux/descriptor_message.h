// Thread safety: a pure function over a socket that only the calling thread reads.
//
// Messages that bring descriptors along. sd-bus drops a message that is malformed with its descriptors
// still open (libsystemd 252), so that anybody could use up all that this process may have. Such
// messages are therefore judged while they are still in the socket, where nothing is open yet.
#pragma once

#include <cstddef>
#include <string>

namespace spacekeep::ipc {

/// Most descriptors of one message, and its most bytes: it has to stand in the socket in one piece.
inline constexpr std::size_t kMaxMessageDescriptors = 8;
inline constexpr std::size_t kMaxDescriptorMessageBytes = 32 * 1024;

/// The next `size` bytes on `socket` are a message that brings descriptors: why sd-bus is not to
/// read it, empty when it will take it. Stricter than D-Bus where nobody needs what it allows: only
/// calls may bring some, all with the first byte, and no field may be there that is not of use.
[[nodiscard]] std::string descriptorMessageProblem(int socket, std::size_t size);

}  // namespace spacekeep::ipc
