// What the log says of a call that comes to nothing.
#include <gtest/gtest.h>

#include <memory>
#include <string>

#include "support/queues/serial_queue.h"
#include "support/queues/waiting.h"
#include "support/services/call_service.h"
#include "tests/helpers/fake_connection.h"
#include "tests/helpers/log_capture.h"
#include "tests/helpers/schedules.h"

namespace spacekeep {
namespace {

using ipc::RemoteProxy;

const ipc::InterfaceDescription kInterface = {"com.quorvel.Test", {{"ask", {}, {}}}};

struct World {
  test::LogCapture log;
  ConcurrentQueue global{{}};
  test::FakeConnector connector;
  std::shared_ptr<test::FakeConnection> connection = std::make_shared<test::FakeConnection>(global);
  std::shared_ptr<const ServiceReference> service =
      std::make_shared<const ServiceReference>(ServiceReference{"svc", connection});
  std::shared_ptr<const ServiceReference> nobody =
      std::make_shared<const ServiceReference>(ServiceReference{"nobody", nullptr});
  ServiceCaller caller{global, connector, kInterface};
  std::string label;  ///< of the queue on which the call handler ran
  CountingSemaphore called{0};
  CountingSemaphore failed{0};

  ServiceCaller::CallHandler ask() {
    return [this](const std::shared_ptr<RemoteProxy>& proxy, const ServiceCaller::Done&) {
      label = SerialQueue::current()->label();
      proxy->call("ask", {}, [](const ipc::Arguments&) {});
      called.signal();
    };
  }
  ServiceCaller::FailureHandler failure() {
    return [this] { failed.signal(); };
  }
};

TEST(LogOfServiceCalls, NamesTheFormOfACallThatReachesNobody) {
  inEverySchedule(20, [] {
    World world;
    world.caller.CallServiceAsync(world.nobody, world.ask(), world.failure());
    world.failed.wait();
    EXPECT_EQ(world.log.texts(kLogTrace),
              std::vector<std::string>{"CallServiceAsync nobody cannot be reached"});
    world.log.clear();
    world.caller.CallService(world.nobody, world.ask(), world.failure());
    EXPECT_EQ(world.log.texts(kLogTrace),
              std::vector<std::string>{"CallService nobody cannot be reached"});
  });
}

TEST(LogOfServiceCalls, NamesTheFormOfACallThatFails) {
  inEverySchedule(20, [] {
    World world;
    world.caller.CallServiceAsync(world.service, world.ask(), world.failure());
    world.called.wait();
    world.connection->failAll();
    world.failed.wait();
    EXPECT_EQ(world.log.texts(kLogTrace),
              std::vector<std::string>{"CallServiceAsync calling svc failed: failed"});
    world.log.clear();
    world.caller.CallService(world.service, world.ask(), world.failure());
    world.connection->failAll();
    world.failed.wait();
    EXPECT_EQ(world.log.texts(kLogTrace),
              std::vector<std::string>{"CallService calling svc failed: failed"});
  });
}

TEST(LogOfServiceCalls, FindsTheQueueOfAServiceUnderItsLabel) {
  inEverySchedule(20, [] {
    World world;
    world.caller.CallService(world.service, world.ask(), world.failure());
    EXPECT_EQ(world.label, "com.quorvel.spacekeep_services.svc");
  });
}

}  // namespace
}  // namespace spacekeep
