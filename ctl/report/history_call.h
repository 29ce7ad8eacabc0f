// Thread safety: for one thread.
//
// How the tool asks the daemon for a page of its history.
#pragma once

#include <spacekeep/client.h>

#include "ctl/report/history_pages.h"

namespace spacekeep::ctl {

/// Asks over `client`, which must outlive what is answered. The deadline holds for each page.
[[nodiscard]] AskHistory historyOver(sdk::Client& client, sdk::Deadline deadline = {});

}  // namespace spacekeep::ctl
