// What the global queue does when the kernel gives it no further thread.
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/resource.h>
#include <unistd.h>

#include <atomic>

#include "support/queues/concurrent_queue.h"
#include "support/queues/waiting.h"

namespace spacekeep {
namespace {

constexpr uid_t kNobody = 65534;

/// For the running process, for good. The limit does not count for root.
void refuseFurtherThreads() {
  const rlimit one{.rlim_cur = 1, .rlim_max = 1};
  if (::setrlimit(RLIMIT_NPROC, &one) != 0) ::_exit(2);
  if (::geteuid() == 0 && ::setresuid(kNobody, kNobody, kNobody) != 0) ::_exit(3);
}

void runATaskWithoutAWorker() {
  refuseFurtherThreads();
  ConcurrentQueue queue({.name = "workers", .parallelism = 2});
  queue.async([] {});
  ::_exit(0);
}

void runASecondTaskBesideABusyWorker() {
  ConcurrentQueue queue({.name = "workers", .parallelism = 2});
  CountingSemaphore started(0);
  std::atomic<bool> go_on = false;
  queue.async([&] {
    started.signal();
    while (!go_on) ::sched_yield();
  });
  started.wait();
  refuseFurtherThreads();
  CountingSemaphore ran(0);
  queue.async([&] { ran.signal(); });
  go_on = true;
  ran.wait();
  ::_exit(0);
}

TEST(WithoutFurtherThreads, AQueueThatHasNoWorkerAtAllEndsTheProcessInsteadOfWaitingForGood) {
  EXPECT_DEATH(runATaskWithoutAWorker(), "workers has no worker: pthread_create");
}

TEST(WithoutFurtherThreads, ATaskIsRunByAWorkerThatIsThereAlready) {
  EXPECT_EXIT(runASecondTaskBesideABusyWorker(), testing::ExitedWithCode(0), "");
}

}  // namespace
}  // namespace spacekeep
