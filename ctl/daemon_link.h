// Thread safety: every function may be called from any thread.
//
// What several commands ask of the daemon.
#pragma once

#include <spacekeep/client.h>

#include "ctl/complaint.h"
#include "support/values/value.h"

namespace spacekeep::ctl {

[[nodiscard]] sdk::Result<sdk::Client> connectTo(const CommonOptions& common);

/// The client state with the daemon's defaults; empty when nothing was ever stored.
[[nodiscard]] sdk::Result<Dictionary> wholeState(const CommonOptions& common,
                                                 sdk::Deadline deadline = {});

}  // namespace spacekeep::ctl
