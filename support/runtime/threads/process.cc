#include <sys/random.h>
#include <unistd.h>

#include <array>
#include <cstdlib>
#include <cstring>
#include <string>

#include "support/runtime/runtime.h"
#include "support/runtime/splitmix.h"

namespace spacekeep::rt {
namespace {

std::uint64_t freshSeed() {
  std::uint64_t seed = 0;
  if (getrandom(&seed, sizeof seed, GRND_NONBLOCK) == static_cast<ssize_t>(sizeof seed))
    return seed;
  // Early in boot there may be no randomness yet; spreading needs no more than different values.
  return ticks() ^ reinterpret_cast<std::uintptr_t>(&seed);
}

}  // namespace

std::uint64_t randomNumber() {
  thread_local SplitMix generator(freshSeed());
  return generator.next();
}

Keeper::Keeper() = default;

Keeper::~Keeper() = default;

void*& threadSlot(ThreadSlot slot) {
  thread_local std::array<void*, static_cast<std::size_t>(ThreadSlot::kCount)> slots{};
  return slots.at(static_cast<std::size_t>(slot));
}

void panic(const char* reason) {
  const std::string line = std::string("panic: ") + reason + "\n";
  [[maybe_unused]] const ssize_t written = write(STDERR_FILENO, line.data(), line.size());
  std::abort();
}

}  // namespace spacekeep::rt
