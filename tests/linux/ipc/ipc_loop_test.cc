#include "support/ipc/linux/ipc_loop.h"

#include <gtest/gtest.h>
#include <sys/resource.h>

namespace spacekeep::ipc::test {
namespace {

void makeOneWithoutDescriptors() {
  rlimit none{};
  ::getrlimit(RLIMIT_NOFILE, &none);
  none.rlim_cur = 3;
  ::setrlimit(RLIMIT_NOFILE, &none);
  const IpcLoop loop;
}

TEST(IpcLoopDeathTest, WithoutADescriptorEndsTheProcessAndSaysWhy) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(makeOneWithoutDescriptors(), "panic: IPC: no descriptor for the event loop");
}

}  // namespace
}  // namespace spacekeep::ipc::test
