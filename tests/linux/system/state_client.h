// Thread safety: one test at a time.
//
// What the tests of the client state share: getting at a daemon that is just starting.
#pragma once

#include <spacekeep/client.h>

#include <cstdint>
#include <memory>

#include "tests/linux/system/sandbox.h"

namespace spacekeep::system_test {

[[nodiscard]] std::uint64_t monotonicMs();

/// A connection on which the daemon has answered. Null when it does not within a minute.
[[nodiscard]] std::unique_ptr<sdk::Client> connectToStarting(const Sandbox& sandbox);

}  // namespace spacekeep::system_test
