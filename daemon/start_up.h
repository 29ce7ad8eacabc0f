// Thread safety: startUp is called once, on the main thread. The handlers may be called from any
// thread.
//
// Start-up of the process, from the first keep-alive transaction to the parked main thread.
#pragma once

#include <optional>

#include "support/events/events.h"
#include "support/platform.h"
#include "support/runtime/runtime.h"

namespace spacekeep {

/// Starts everything and parks. Returns only if `events.park()` does.
void startUp(Platform& platform, EventSources& events, KeepAlive& keep_alive);

/// Sets gTimebaseConversion; leaves it alone when the timebase could not be read.
void setTimebaseConversion(const std::optional<rt::Timebase>& timebase);

/// The daily periodic pass over every local volume, one after another. Does nothing unless the
/// activity is in its run state.
void handleDailyActivity(Platform& platform, KeepAlive& keep_alive, const Activity& activity);

/// An event of the file-system stream. Returns when the work that it caused has ended.
void handleStreamEvent(KeepAlive& keep_alive, const Dictionary& event);

/// Ends the process at once with status 0. Safe as a signal handler.
void sigterm_handler(int signal_number);

}  // namespace spacekeep
