// Thread safety: used by one schedule at a time.
//
// Stacks for fibers. Each is its own mapping with an unreachable page below it, so that an overflow
// faults instead of writing over a neighbour. A schedule starts fibers by the thousand, so stacks
// are kept for the next one.
#pragma once

#include <cstddef>
#include <vector>

namespace spacekeep::rt::simulated {

struct Stack {
  std::byte* bottom = nullptr;  ///< lowest usable address
  std::size_t bytes = 0;
};

class StackPool {
 public:
  static constexpr std::size_t kMaxKept = 256;

  StackPool() = default;
  ~StackPool();
  StackPool(const StackPool&) = delete;
  StackPool& operator=(const StackPool&) = delete;

  [[nodiscard]] Stack take();
  /// The stack must not be in use any more.
  void giveBack(Stack stack);

 private:
  std::vector<Stack> kept_;
};

}  // namespace spacekeep::rt::simulated
