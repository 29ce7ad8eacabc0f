// What is told when nobody hears the launched signal.
#include <gtest/gtest.h>

#include <cstdlib>

#include "support/events/linux/linux_event_sources.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/events/event_world.h"

namespace spacekeep {
namespace {

using test::comesTrue;
using test::LogCapture;
using test::ScratchDirectory;

class NoVolumes final : public SpaceSource {
 public:
  std::vector<VolumeSample> sampleLocalVolumes() override { return {}; }
  void setThresholdsChangedHandler(std::function<void()>) override {}
};

class LaunchSignal : public testing::Test {
 protected:
  LaunchSignal() { ::unsetenv("NOTIFY_SOCKET"); }

  LogCapture log_;
  const ScratchDirectory directory_;
  NoVolumes space_;
  ConcurrentQueue global_{ConcurrentQueue::Options{}};
  LinuxEventSources events_{
      std::make_shared<EventLoop>(), global_, space_,
      LinuxEventSources::Options{.launch_directories = {},
                                 .state_directory = directory_.path(),
                                 .power_supply_directory = directory_.path() + "/power",
                                 .system_bus_socket = directory_.path() + "/bus"}};
};

TEST_F(LaunchSignal, WhenTheBusDoesNotListenAProblemNamesTheSignalAndTheReason) {
  directory_.write("bus", "no socket");
  EXPECT_EQ(events_.postNotification("com.quorvel.spacekeep.launched"), 0);
  EXPECT_TRUE(comesTrue([&] {
    return log_.countExact(kLogProblem,
                           "postNotification no signal com.quorvel.spacekeep.launched on the "
                           "system bus: Connection refused") == 1;
  }));
}

TEST_F(LaunchSignal, WithoutABusThereIsATraceAndNoProblem) {
  EXPECT_EQ(events_.postNotification("com.quorvel.spacekeep.launched"), 0);
  EXPECT_TRUE(comesTrue([&] {
    return log_.countExact(kLogTrace,
                           "postNotification no system bus to send com.quorvel.spacekeep.launched "
                           "on") == 1;
  }));
  EXPECT_TRUE(log_.texts(kLogProblem).empty());
}

}  // namespace
}  // namespace spacekeep
