// Thread safety: may be called from any thread.
#pragma once

#include <string>

namespace spacekeep {

/// 128 bits of the kernel's randomness (getrandom(2)) as 32 hexadecimal digits: a token that nobody
/// gets twice and nobody can guess.
[[nodiscard]] std::string randomToken();

}  // namespace spacekeep
