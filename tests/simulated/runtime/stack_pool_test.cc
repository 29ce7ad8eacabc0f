// Where the stacks of fibers come from and go to.
#include "support/runtime/simulated/stack_pool.h"

#include <gtest/gtest.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cerrno>
#include <cstddef>
#include <vector>

namespace spacekeep::rt::simulated {
namespace {

bool isMapped(const std::byte* page, std::size_t bytes) {
  return ::msync(const_cast<std::byte*>(page), bytes, MS_ASYNC) == 0 || errno != ENOMEM;
}

TEST(StackPool, AStackThatIsNotKeptIsUnmappedFromItsGuardToItsTop) {
  const auto page_bytes = static_cast<std::size_t>(::sysconf(_SC_PAGESIZE));
  StackPool pool;
  std::vector<Stack> taken;
  while (taken.size() <= StackPool::kMaxKept) taken.push_back(pool.take());
  for (const Stack& stack : taken) pool.giveBack(stack);
  const Stack& first = taken.front();
  EXPECT_TRUE(isMapped(first.bottom, first.bytes));
  const Stack& last = taken.back();
  EXPECT_FALSE(isMapped(last.bottom - page_bytes, page_bytes));
  EXPECT_FALSE(isMapped(last.bottom, page_bytes));
  EXPECT_FALSE(isMapped(last.bottom + last.bytes - page_bytes, page_bytes));
}

}  // namespace
}  // namespace spacekeep::rt::simulated
