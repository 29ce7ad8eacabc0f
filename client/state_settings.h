// Thread safety: pure functions.
//
// What the client state tells the daemon itself.
#pragma once

#include <functional>
#include <string>

#include "support/values/value.h"

namespace spacekeep {

/// Told what is wrong with one value, in words for a person.
using RefuseSetting = std::function<void(const std::string& problem)>;

/// Whether the daemon acts on a change of this key.
[[nodiscard]] bool isSettingKey(const std::string& key);

/// "SPACEKEEP_FINISH_EARLY" of `state`: what holds for purges that do not say. False when absent;
/// anything but a boolean is refused and counts as absent.
[[nodiscard]] bool finishEarlyFrom(const Dictionary& state, const RefuseSetting& refuse);

}  // namespace spacekeep
