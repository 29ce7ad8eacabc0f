// Thread safety: for one thread at a time.
//
// A call to the daemon during which a person sees that something goes on.
#pragma once

#include <spacekeep/client.h>

#include <cstdint>
#include <functional>

namespace spacekeep::ctl {

/// From a reading of rt::ticks() to now.
[[nodiscard]] double secondsSince(std::uint64_t start_ticks);

/// Starts a call with the handler it is given, and until the reply is there calls `show` five times
/// a second, from this thread, with the seconds since the start.
[[nodiscard]] sdk::Reply callShowing(const std::function<void(sdk::Client::ReplyHandler)>& start,
                                     const std::function<void(double elapsed_seconds)>& show);

}  // namespace spacekeep::ctl
