#include "support/linux/token.h"

#include <fmt/format.h>
#include <sys/random.h>

#include <array>
#include <cerrno>
#include <cstdint>

#include "support/runtime/runtime.h"

namespace spacekeep {

std::string randomToken() {
  std::array<std::uint64_t, 2> bits{};
  // So few bytes come whole or not at all.
  while (::getrandom(bits.data(), sizeof(bits), 0) != static_cast<ssize_t>(sizeof(bits))) {
    if (errno != EINTR) rt::panic("the kernel has no random numbers");
  }
  return fmt::format("{:016x}{:016x}", bits[0], bits[1]);
}

}  // namespace spacekeep
