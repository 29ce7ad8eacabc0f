// Thread safety: pure function; what it returns may be used from any thread.
#pragma once

#include <memory>

#include "client/client_protocol.h"
#include "support/ipc/served.h"

namespace spacekeep {

/// Serves `exported` to the peers of a listener: decodes, calls, encodes. Does not keep `exported`
/// alive, because the object owns the listener that serves it.
[[nodiscard]] ipc::ServedInterface makeClientAdaptor(
    std::weak_ptr<SpacekeepClientProtocol> exported);

}  // namespace spacekeep
