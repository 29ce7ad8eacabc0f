// Thread safety: pure functions over the kernel's state, from any thread.
//
// Unix stream sockets: binding, connecting, and judging a descriptor that a peer has sent.
#pragma once

#include <sys/types.h>

#include <string>

#include "support/ipc/arguments.h"

namespace spacekeep::ipc {

/// A listening, non-blocking socket at `path` with the given mode (permission bits). A socket file
/// that nobody serves any more is replaced; one that is served, or a file of another type, is left
/// alone. Null on failure, with the reason in `why`.
[[nodiscard]] SharedDescriptor bindListeningSocket(const std::string& path, mode_t mode,
                                                   std::string& why);

/// The listening socket that the service manager passed (sd_listen_fds(3)), null when there is
/// none. Taken over.
[[nodiscard]] SharedDescriptor listeningSocketFromServiceManager();

/// For a listening socket that another process has made. Who connects is told by the kernel that the
/// process which has called listen(2) last is at the other end (unix(7), SO_PEERCRED), and so would
/// look at whether that one lives, not at whether this one does. Those that have connected already
/// go on as they are.
void takeOverListening(int fd);

/// A connected, non-blocking socket. Null on failure, with the reason in `why`. Never waits: a full
/// backlog is a failure.
[[nodiscard]] SharedDescriptor connectSocket(const std::string& path, std::string& why);

struct EndpointRules {
  bool refuse_own_process = true;
  std::string
      own_address;  ///< address (as in sun_path) on which this process listens, may be empty
};

/// What is wrong with a descriptor on whose other end a service is to answer, empty when nothing:
/// it must be a connected AF_UNIX stream socket whose peer has not hung up and is not this process.
[[nodiscard]] std::string endpointProblem(int fd, const EndpointRules& rules);

/// Both ends of a fresh socket pair, close-on-exec: serve on one, pass the other at check-in.
struct SocketPair {
  SharedDescriptor first;
  SharedDescriptor second;
};
/// Null descriptors when the process has none left.
[[nodiscard]] SocketPair makeSocketPair();

}  // namespace spacekeep::ipc
