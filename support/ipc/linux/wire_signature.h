// Thread safety: a pure function.
#pragma once

#include <string_view>

namespace spacekeep::ipc {

/// Any number of complete types, as "Type System" of the D-Bus specification has them: at most 255
/// bytes, arrays and structures each at most 32 deep, dictionary entries in arrays only.
[[nodiscard]] bool isWireSignature(std::string_view signature);

}  // namespace spacekeep::ipc
