// Thread safety: may be called from any thread.
//
// Asks the kernel who is connected to a unix socket.
#pragma once

#include <sys/types.h>

#include <memory>
#include <optional>

#include "support/access/peer_identity.h"

namespace spacekeep::access {

/// The identity behind a connected unix stream socket (unix(7): SO_PEERCRED, SO_PEERGROUPS,
/// SO_PEERSEC, SO_PEERPIDFD). Null when the kernel does not even tell the user: such a peer has to
/// be refused. Whatever else it does not tell is left out of the identity and unclear there. Does
/// not take over `fd`.
[[nodiscard]] std::shared_ptr<const PeerIdentity> capturePeerIdentity(int fd);

/// Adds what /proc tells of the process behind `facts.pidfd`. False when the unit stays unclear:
/// there is no pidfd, the process is gone, or nothing says where it belongs.
[[nodiscard]] bool addFactsOfProcess(PeerFacts& facts);

/// The user alone, for what must cost little. None as above.
[[nodiscard]] std::optional<uid_t> peerUid(int fd);

}  // namespace spacekeep::access
