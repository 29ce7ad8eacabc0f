#include "support/runtime/simulated/context.h"

#include <cxxabi.h>

#include <cstdint>
#include <cstring>

#include "support/runtime/simulated/sanitizer.h"

#if defined(SPACEKEEP_RT_FAST_SWITCH)
// void spacekeepSwitchStack(void** save_pointer, void* next_pointer)
// Saves what the System V ABI for x86-64 lets a callee keep, and returns on the other stack.
asm(R"(
.text
.globl spacekeepSwitchStack
.hidden spacekeepSwitchStack
.type spacekeepSwitchStack, @function
spacekeepSwitchStack:
  pushq %rbp
  pushq %rbx
  pushq %r12
  pushq %r13
  pushq %r14
  pushq %r15
  movq %rsp, (%rdi)
  movq %rsi, %rsp
  popq %r15
  popq %r14
  popq %r13
  popq %r12
  popq %rbx
  popq %rbp
  ret
.size spacekeepSwitchStack, .-spacekeepSwitchStack
)");
extern "C" void spacekeepSwitchStack(void** save_pointer, void* next_pointer);
#endif

namespace spacekeep::rt::simulated {
namespace {

// The context that the last switch left; only its stack's bounds are still to be learned.
Stack* left_stack = nullptr;

}  // namespace

#if defined(SPACEKEEP_RT_FAST_SWITCH)

Context::Context(Stack stack, void (*entry)()) : stack_(stack) {
  // From the top: no return address for `entry`, `entry` for the switch to return to, and the six
  // registers it restores. The ABI wants the stack 8 bytes off 16 at the start of a function.
  constexpr std::size_t kSlots = 8;
  std::uintptr_t slots[kSlots] = {};
  slots[kSlots - 2] = reinterpret_cast<std::uintptr_t>(entry);
  std::byte* const pointer = stack.bottom + stack.bytes - sizeof slots;
  std::memcpy(pointer, slots, sizeof slots);
  stack_pointer_ = pointer;
}

void Context::jumpTo(Context& next) { spacekeepSwitchStack(&stack_pointer_, next.stack_pointer_); }

#else

Context::Context(Stack stack, void (*entry)()) : stack_(stack) {
  getcontext(&registers_);
  registers_.uc_stack.ss_sp = stack.bottom;
  registers_.uc_stack.ss_size = stack.bytes;
  makecontext(&registers_, entry, 0);
}

void Context::jumpTo(Context& next) { swapcontext(&registers_, &next.registers_); }

#endif

void Context::exchangeExceptions(const Context& next) {
  void* const globals = abi::__cxa_get_globals();
  std::memcpy(&exceptions_, globals, sizeof exceptions_);
  std::memcpy(globals, &next.exceptions_, sizeof exceptions_);
}

void Context::switchTo(Context& next) {
  exchangeExceptions(next);
  left_stack = &stack_;
  beforeSwitch(&fake_stack_, next.stack_.bottom, next.stack_.bytes);
  jumpTo(next);
  const void* bottom = nullptr;
  std::size_t bytes = 0;
  afterSwitch(fake_stack_, &bottom, &bytes);
}

void Context::leaveTo(Context& next) {
  exchangeExceptions(next);
  left_stack = nullptr;
  beforeSwitch(nullptr, next.stack_.bottom, next.stack_.bytes);
  jumpTo(next);
}

void Context::arrive() {
  const void* bottom = nullptr;
  std::size_t bytes = 0;
  afterSwitch(nullptr, &bottom, &bytes);
  // Only the caller's own stack has unknown bounds, and it is what the first switch leaves.
  if (left_stack != nullptr && left_stack->bottom == nullptr) {
    *left_stack = {static_cast<std::byte*>(const_cast<void*>(bottom)), bytes};
  }
}

}  // namespace spacekeep::rt::simulated
