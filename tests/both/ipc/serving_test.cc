// On what threads handlers run, when they may, and whom they serve.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <vector>

#include "support/ipc/lanes.h"
#include "support/ipc/served.h"
#include "support/ipc/serving_gate.h"
#include "support/queues/waiting.h"
#include "support/runtime/runtime.h"
#include "tests/helpers/schedules.h"

namespace spacekeep::ipc {
namespace {

class NamelessPeer : public PeerConnection {
 public:
  [[nodiscard]] const access::PeerIdentity& identity() const override { rt::panic("no identity"); }
};

TEST(CurrentConnection, IsTheInnermostOneOfTheRunningThread) {
  inEverySchedule(50, [] {
    NamelessPeer outer;
    NamelessPeer inner;
    EXPECT_EQ(currentConnection(), nullptr);
    {
      const ServingScope serving(&outer);
      EXPECT_EQ(currentConnection(), &outer);
      {
        const ServingScope nested(&inner);
        EXPECT_EQ(currentConnection(), &inner);
        rt::Thread other("other", [] { EXPECT_EQ(currentConnection(), nullptr); });
        other.join();
      }
      EXPECT_EQ(currentConnection(), &outer);
    }
    EXPECT_EQ(currentConnection(), nullptr);
  });
}

TEST(Lanes, StartInOrderAndNeverBeyondTheirWidth) {
  inEverySchedule(200, [] {
    std::vector<int> order;
    std::atomic<int> running = 0;
    std::atomic<int> most = 0;
    rt::Mutex mutex;
    {
      ConcurrentQueue global({.name = "global", .parallelism = 4});
      const auto lanes = std::make_shared<Lanes>(global);
      for (int i = 0; i < 12; ++i) {
        lanes->run("narrow", 1, [&order, i] { order.push_back(i); });
        lanes->run("wide", 3, [&running, &most, &mutex] {
          const int now = ++running;
          {
            const std::scoped_lock lock(mutex);
            if (now > most) most = now;
          }
          rt::sleepNs(1000);
          --running;
        });
      }
    }
    std::vector<int> expected(12);
    for (int i = 0; i < 12; ++i) expected[static_cast<std::size_t>(i)] = i;
    EXPECT_EQ(order, expected);
    EXPECT_LE(most, 3);
    EXPECT_EQ(running, 0);
  });
}

TEST(Lanes, ThatAreFullNeedNoFurtherThreads) {
  inEverySchedule(20, [] {
    CountingSemaphore release(0);
    std::atomic<int> done = 0;
    ConcurrentQueue global({.name = "global", .parallelism = 2});
    const auto lanes = std::make_shared<Lanes>(global);
    for (int i = 0; i < 500; ++i) {
      lanes->run("blocking", 4, [&release, &done] {
        release.wait();
        ++done;
      });
    }
    // Another task still finds a thread.
    CountingSemaphore other(0);
    global.async([&other] { other.signal(); });
    other.wait();
    EXPECT_GE(lanes->waiting("blocking"), 490U);
    for (int i = 0; i < 500; ++i) release.signal();
    while (done < 500) rt::sleepNs(1'000'000);
    EXPECT_LE(global.counts().peak_threads, 8U);
  });
}

TEST(ServingGate, WaitsForThoseInsideAndLetsNobodyElseIn) {
  inEverySchedule(300, [] {
    ServingGate gate;
    std::atomic<bool> closed = false;
    std::atomic<int> served_after_close = 0;
    std::vector<rt::Thread> threads;
    for (int i = 0; i < 3; ++i) {
      threads.emplace_back("handler", [&] {
        for (int k = 0; k < 3; ++k) {
          const GatePass pass(gate);
          if (pass.inside() && closed) ++served_after_close;
        }
      });
    }
    gate.closeAndWait();
    closed = true;
    for (rt::Thread& thread : threads) thread.join();
    EXPECT_EQ(served_after_close, 0);
    EXPECT_FALSE(GatePass(gate).inside());
  });
}

}  // namespace
}  // namespace spacekeep::ipc
