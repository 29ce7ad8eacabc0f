#include "support/runtime/simulated/stack_pool.h"

#include <sys/mman.h>
#include <unistd.h>

#include "support/runtime/runtime.h"
#include "support/runtime/simulated/sanitizer.h"
#include "support/runtime/stack_size.h"

namespace spacekeep::rt::simulated {
namespace {

std::size_t guardBytes() { return static_cast<std::size_t>(sysconf(_SC_PAGESIZE)); }

Stack mapStack() {
  const std::size_t guard = guardBytes();
  void* const mapping = mmap(nullptr, guard + kThreadStackBytes, PROT_READ | PROT_WRITE,
                             MAP_PRIVATE | MAP_ANONYMOUS | MAP_NORESERVE | MAP_STACK, -1, 0);
  if (mapping == MAP_FAILED) panic("no memory for the stack of a fiber");
  if (mprotect(mapping, guard, PROT_NONE) != 0) panic("no guard page for the stack of a fiber");
  return {static_cast<std::byte*>(mapping) + guard, kThreadStackBytes};
}

void unmapStack(Stack stack) { munmap(stack.bottom - guardBytes(), guardBytes() + stack.bytes); }

}  // namespace

StackPool::~StackPool() {
  for (const Stack stack : kept_) unmapStack(stack);
}

Stack StackPool::take() {
  if (kept_.empty()) return mapStack();
  const Stack stack = kept_.back();
  kept_.pop_back();
  return stack;
}

void StackPool::giveBack(Stack stack) {
  // The frames that were left by the last switch never cleared their red zones.
  unpoison(stack.bottom, stack.bytes);
  if (kept_.size() < kMaxKept) {
    kept_.push_back(stack);
  } else {
    unmapStack(stack);
  }
}

}  // namespace spacekeep::rt::simulated
