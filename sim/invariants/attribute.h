// Thread safety: one thread at a time for each story.
//
// Which purge each piece of a story belongs to: share computations, replies, failures, calls.
#pragma once

#include "sim/invariants/purge_story.h"

namespace spacekeep::sim {

/// The story's pieces have been read, but for whom they belong to. What belongs to nobody becomes an
/// oddity.
void attribute(PurgeStory& story);

}  // namespace spacekeep::sim
