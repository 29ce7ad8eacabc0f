// Thread safety: pure function.
//
// Turns failures of the IPC layer into the library's own.
#pragma once

#include <spacekeep/error.h>

#include "support/ipc/connection.h"

namespace spacekeep::sdk {

/// `operation` is the operation that failed, for the text.
[[nodiscard]] Error failureOf(const ipc::Error& error, std::string_view operation);

}  // namespace spacekeep::sdk
