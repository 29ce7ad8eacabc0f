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

TEST(LaunchSignal, WhenTheBusDoesNotListenATraceNamesTheSignalAndTheReason) {
  ::unsetenv("NOTIFY_SOCKET");
  const LogCapture log;
  const ScratchDirectory directory;
  directory.write("bus", "no socket");
  NoVolumes space;
  ConcurrentQueue global{ConcurrentQueue::Options{}};
  LinuxEventSources events(
      std::make_shared<EventLoop>(), global, space,
      LinuxEventSources::Options{.launch_directories = {},
                                 .state_directory = directory.path(),
                                 .power_supply_directory = directory.path() + "/power",
                                 .system_bus_socket = directory.path() + "/bus"});
  EXPECT_EQ(events.postNotification("com.quorvel.spacekeep.launched"), 0);
  EXPECT_TRUE(comesTrue([&] {
    return log.countExact(kLogTrace,
                          "postNotification no signal com.quorvel.spacekeep.launched on the system "
                          "bus: Connection refused") == 1;
  }));
}

}  // namespace
}  // namespace spacekeep
