// What the process may use up, seen from inside.
#include "support/linux/process_limits.h"

#include <gtest/gtest.h>
#include <malloc.h>
#include <sys/resource.h>

#include <barrier>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace spacekeep {
namespace {

constexpr int kThreads = 24;

// A sanitizer brings a heap of its own.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
constexpr bool kHasTheHeapOfTheLibrary = false;
#else
constexpr bool kHasTheHeapOfTheLibrary = true;
#endif

/// As many heaps as malloc_info(3) tells of.
int heaps() {
  char* text = nullptr;
  std::size_t size = 0;
  std::FILE* stream = open_memstream(&text, &size);
  malloc_info(0, stream);
  std::fclose(stream);
  const std::string info(text, size);
  std::free(text);
  int count = 0;
  for (std::size_t at = info.find("<heap nr="); at != std::string::npos;
       at = info.find("<heap nr=", at + 1)) {
    ++count;
  }
  return count;
}

/// Threads that all have something on the heap at the same time.
int heapsOfManyThreads() {
  std::barrier all_have(kThreads + 1);
  std::barrier looked_at(kThreads + 1);
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&all_have, &looked_at] {
      const auto block = std::make_unique<std::vector<char>>(1000);
      all_have.arrive_and_wait();
      looked_at.arrive_and_wait();
    });
  }
  all_have.arrive_and_wait();
  const int count = heaps();
  looked_at.arrive_and_wait();
  for (std::thread& thread : threads) thread.join();
  return count;
}

// In a process of its own, since the limit cannot be taken back.
TEST(ProcessLimitsDeathTest, ManyThreadsShareFewHeaps) {
  if (!kHasTheHeapOfTheLibrary) return;
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_EXIT(
      {
        limitHeapArenas();
        std::_Exit(heapsOfManyThreads());
      },
      testing::ExitedWithCode(kHeapArenas), "");
}

long residentKib() {
  std::ifstream status("/proc/self/status");
  for (std::string line; std::getline(status, line);) {
    if (line.starts_with("VmRSS:")) return std::stol(line.substr(6));
  }
  return 0;
}

TEST(ProcessLimits, FreeMemoryBetweenWhatIsInUseIsGivenBack) {
  if (!kHasTheHeapOfTheLibrary) return;
  constexpr std::size_t kBlocks = 20'000;
  std::vector<std::unique_ptr<std::vector<char>>> blocks;
  for (std::size_t i = 0; i < kBlocks; ++i) {
    blocks.push_back(std::make_unique<std::vector<char>>(2000, 'x'));
  }
  for (std::size_t i = 0; i < kBlocks; ++i) {
    if (i % 100 != 0) blocks[i].reset();
  }
  const long before_kib = residentKib();
  giveBackFreeMemory();
  EXPECT_LT(residentKib(), before_kib - 20'000);
}

TEST(ProcessLimits, AllDescriptorsThatTheKernelAllowsMayBeOpen) {
  rlimit files = {};
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &files), 0);
  files.rlim_cur = 64;
  ASSERT_EQ(setrlimit(RLIMIT_NOFILE, &files), 0);
  raiseDescriptorLimit();
  ASSERT_EQ(getrlimit(RLIMIT_NOFILE, &files), 0);
  EXPECT_EQ(files.rlim_cur, files.rlim_max);
}

}  // namespace
}  // namespace spacekeep
