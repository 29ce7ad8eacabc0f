#include "support/services/call_service.h"

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "tests/helpers/fake_connection.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

using ipc::RemoteProxy;

const ipc::InterfaceDescription kInterface = {"com.quorvel.Test", {{"ask", {}, {}}}};

struct World {
  ConcurrentQueue global{{}};
  test::FakeConnector connector;
  std::shared_ptr<test::FakeConnection> connection = std::make_shared<test::FakeConnection>(global);
  std::shared_ptr<const ServiceReference> service =
      std::make_shared<const ServiceReference>(ServiceReference{"svc", connection});
  ServiceCaller caller{global, connector, kInterface};
  std::atomic<int> calls{0};
  std::atomic<int> failures{0};
  std::atomic<int> replies{0};
  CountingSemaphore called{0};
  CountingSemaphore failed{0};
  CountingSemaphore replied{0};

  void ask(const std::shared_ptr<const ServiceReference>& whom) {
    caller.CallServiceAsync(whom, askHandler(), failureHandler());
  }
  ServiceCaller::CallHandler askHandler() {
    return [this](const std::shared_ptr<RemoteProxy>& proxy, const ServiceCaller::Done& done) {
      proxy->call("ask", {}, [this, done](const ipc::Arguments&) {
        done();
        ++replies;
        replied.signal();
      });
      ++calls;
      called.signal();
    };
  }
  ServiceCaller::FailureHandler failureHandler() {
    return [this] {
      ++failures;
      failed.signal();
    };
  }
};

TEST(CallServiceAsync, HandsTheProxyOfTheRecordsConnectionToTheCallHandler) {
  inEverySchedule(100, [] {
    World world;
    world.ask(world.service);
    world.called.wait();
    world.connection->answerAll();
    world.replied.wait();
    EXPECT_EQ(world.connection->members(), std::vector<std::string>{"ask"});
    EXPECT_EQ(world.failures, 0);
  });
}

TEST(CallServiceAsync, WithoutARecordRunsTheFailureHandlerOnly) {
  inEverySchedule(100, [] {
    World world;
    world.ask(nullptr);
    world.failed.wait();
    EXPECT_EQ(world.calls, 0);
    EXPECT_EQ(world.failures, 1);
  });
}

TEST(CallServiceAsync, ReachesARecordWithoutConnectionUnderItsId) {
  inEverySchedule(100, [] {
    World world;
    world.connector.declared["declared"] = world.connection;
    world.ask(std::make_shared<const ServiceReference>(ServiceReference{"declared", nullptr}));
    world.called.wait();
    EXPECT_EQ(world.connection->members(), std::vector<std::string>{"ask"});
  });
}

TEST(CallServiceAsync, ServiceThatCannotBeReachedIsAFailure) {
  inEverySchedule(100, [] {
    World world;
    world.ask(std::make_shared<const ServiceReference>(ServiceReference{"nobody", nullptr}));
    world.failed.wait();
    EXPECT_EQ(world.calls, 0);
    EXPECT_EQ(world.failures, 1);
  });
}

TEST(CallServiceAsync, ConnectionThatFailsBeforeTheReplyIsAFailure) {
  inEverySchedule(100, [] {
    World world;
    world.ask(world.service);
    world.called.wait();
    world.connection->failAll();
    world.failed.wait();
    EXPECT_EQ(world.replies, 0);
    EXPECT_EQ(world.failures, 1);
  });
}

TEST(CallServiceAsync, FailsOnceHoweverManyCallsOfTheHandlerFail) {
  inEverySchedule(100, [] {
    std::atomic<int> failures = 0;
    {
      World world;
      world.caller.CallServiceAsync(
          world.service,
          [&world](const std::shared_ptr<RemoteProxy>& proxy, const ServiceCaller::Done&) {
            for (int i = 0; i < 3; ++i) proxy->call("ask", {}, [](const ipc::Arguments&) {});
            world.called.signal();
          },
          [&failures] { ++failures; });
      world.called.wait();
      world.connection->failAll();
    }
    EXPECT_EQ(failures, 1);
  });
}

TEST(CallServiceAsync, NeverFailsAfterDone) {
  inEverySchedule(100, [] {
    std::atomic<int> failures = 0;
    {
      World world;
      world.caller.CallServiceAsync(
          world.service,
          [&world](const std::shared_ptr<RemoteProxy>& proxy, const ServiceCaller::Done& done) {
            proxy->call("ask", {}, [](const ipc::Arguments&) {});
            done();
            world.called.signal();
          },
          [&failures] { ++failures; });
      world.called.wait();
      world.connection->failAll();
    }
    EXPECT_EQ(failures, 0);
  });
}

TEST(CallServiceAsync, RunsNothingFromWithinTheCall) {
  inEverySchedule(200, [] {
    World world;
    // The failure handler needs the very queue that the caller is on.
    const auto queue = SerialQueue::create("caller", world.global);
    std::atomic<bool> returned = false;
    bool failed_after_return = false;
    queue->sync([&] {
      world.caller.CallServiceAsync(nullptr, world.askHandler(), [&] {
        queue->sync([&] { failed_after_return = returned; });
        world.failed.signal();
      });
      returned = true;
    });
    world.failed.wait();
    EXPECT_TRUE(failed_after_return);
  });
}

/// Each thread has slots of its own, so their address tells threads apart.
const void* currentThread() { return &rt::threadSlot(rt::ThreadSlot::kPoolWorker); }

TEST(CallServiceAsync, RunsNeitherHandlerOnTheThreadOfTheCaller) {
  inEverySchedule(200, [] {
    World world;
    const void* const caller = currentThread();
    std::atomic<const void*> called_on = nullptr;
    std::atomic<const void*> failed_on = nullptr;
    const auto call = [&](const std::shared_ptr<RemoteProxy>&, const ServiceCaller::Done& done) {
      called_on = currentThread();
      done();
      world.called.signal();
    };
    const auto failure = [&] {
      failed_on = currentThread();
      world.failed.signal();
    };
    world.caller.CallServiceAsync(world.service, call, nullptr);
    world.called.wait();
    EXPECT_NE(called_on, caller);
    for (const auto& unreachable :
         {std::shared_ptr<const ServiceReference>(),
          std::make_shared<const ServiceReference>(ServiceReference{"nobody", nullptr})}) {
      failed_on = nullptr;
      world.caller.CallServiceAsync(unreachable, world.askHandler(), failure);
      world.failed.wait();
      EXPECT_NE(failed_on, caller);
    }
  });
}

TEST(CallServiceAsync, KeepsTheOrderOfCallsToOneService) {
  inEverySchedule(300, [] {
    World world;
    std::vector<int> order;  // call handlers of one service never overlap
    for (int i = 0; i < 6; ++i) {
      world.caller.CallServiceAsync(
          world.service,
          [&world, &order, i](const std::shared_ptr<RemoteProxy>&, const ServiceCaller::Done&) {
            order.push_back(i);
            world.called.signal();
          },
          nullptr);
    }
    for (int i = 0; i < 6; ++i) world.called.wait();
    EXPECT_EQ(order, (std::vector<int>{0, 1, 2, 3, 4, 5}));
  });
}

TEST(CallServiceAsync, OneServiceDoesNotHoldUpAnother) {
  inEverySchedule(100, [] {
    CountingSemaphore release(0);  // outlives the queue whose task waits for it
    World world;
    world.caller.CallServiceAsync(
        world.service,
        [&release](const std::shared_ptr<RemoteProxy>&, const ServiceCaller::Done&) {
          release.wait();
        },
        nullptr);
    world.ask(
        std::make_shared<const ServiceReference>(ServiceReference{"other", world.connection}));
    world.called.wait();
    release.signal();
  });
}

TEST(CallServiceAsync, ServicesThatAreNotBeingCalledAreForgotten) {
  inEverySchedule(3, [] {
    World world;
    for (int i = 0; i < 500; ++i) {
      world.ask(std::make_shared<const ServiceReference>(
          ServiceReference{"svc" + std::to_string(i), world.connection}));
      world.called.wait();
    }
    EXPECT_LE(world.caller.rememberedOrders(), 128U);
  });
}

TEST(CallService, ReturnsOnceTheCallHandlerWasInvoked) {
  inEverySchedule(200, [] {
    World world;
    world.caller.CallService(world.service, world.askHandler(), world.failureHandler());
    EXPECT_EQ(world.calls, 1);
    EXPECT_EQ(world.replies, 0);
    world.connection->answerAll();
    world.replied.wait();
  });
}

TEST(CallService, ReturnsOnceTheFailureHandlerHasRun) {
  inEverySchedule(200, [] {
    World world;
    world.caller.CallService(nullptr, world.askHandler(), world.failureHandler());
    EXPECT_EQ(world.failures, 1);
    world.caller.CallService(
        std::make_shared<const ServiceReference>(ServiceReference{"nobody", nullptr}),
        world.askHandler(), world.failureHandler());
    EXPECT_EQ(world.failures, 2);
    EXPECT_EQ(world.calls, 0);
  });
}

TEST(CallService, MayBeCalledFromManyTasksAtOnce) {
  inEverySchedule(100, [] {
    World world;
    TaskGroup group;
    for (int i = 0; i < 8; ++i) {
      group.async(world.global, [&world] {
        world.caller.CallService(world.service, world.askHandler(), world.failureHandler());
      });
    }
    group.wait();
    EXPECT_EQ(world.calls, 8);
  });
}

}  // namespace
}  // namespace spacekeep
