#include "support/events/linux/linux_event_sources.h"

#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdlib>

#include "support/queues/waiting.h"
#include "support/runtime/guarded.h"
#include "tests/helpers/log_capture.h"
#include "tests/linux/events/event_world.h"

namespace spacekeep {
namespace {

using test::comesTrue;
using test::LogCapture;
using test::NotifySocket;
using test::ScratchDirectory;

/// Volumes that are all well until the test says otherwise.
class Space final : public SpaceSource {
 public:
  std::vector<VolumeSample> sampleLocalVolumes() override {
    ++looks;
    const VolumeSpace space{.size_bytes = 1ULL << 40, .available_bytes = 1ULL << 39};
    return {{.volume = "/data",
             .file_system = 1,
             .space = space,
             .thresholds = spaceThresholds(space, {}),
             .level = is_low ? SpaceLevel::kLow : SpaceLevel::kEnough}};
  }
  void setThresholdsChangedHandler(std::function<void()> changed) override {
    thresholds_changed.set(std::move(changed));
  }
  std::atomic<int> looks{0};
  std::atomic<bool> is_low{false};
  rt::Guarded<std::function<void()>> thresholds_changed;
};

class EventSourcesOnLinux : public ::testing::Test {
 protected:
  std::unique_ptr<LinuxEventSources> make(
      std::shared_ptr<EventLoop> loop = std::make_shared<EventLoop>()) {
    return std::make_unique<LinuxEventSources>(
        std::move(loop), global_, space_,
        LinuxEventSources::Options{.launch_directories = {directory_.path() + "/launch.d"},
                                   .state_directory = directory_.path(),
                                   .power_supply_directory = directory_.path() + "/power",
                                   .system_bus_socket = directory_.path() + "/bus"});
  }

  ScratchDirectory directory_;
  Space space_;
  ConcurrentQueue global_{ConcurrentQueue::Options{}};
};

TEST_F(EventSourcesOnLinux, AnActivityRunsByItsLaunchFile) {
  directory_.write("launch.d/daily.plist",
                   "<plist version=\"1.0\"><dict><key>INTERVAL_SECONDS</key>"
                   "<integer>3600</integer></dict></plist>");
  const auto events = make();
  CountingSemaphore ran(0);
  events->registerActivity("daily", [&](Activity& activity) {
    if (activity.state() == ActivityState::kRun) ran.signal();
  });
  ran.wait();
  EXPECT_EQ(::access((directory_.path() + "/daily.run").c_str(), F_OK), 0);
}

TEST_F(EventSourcesOnLinux, AnUnknownStreamIsLogged) {
  const LogCapture log;
  const auto events = make();
  events->setStreamHandler("com.quorvel.dispatch.other", global_, [](const Dictionary&) {});
  EXPECT_EQ(log.countExact(kLogProblem,
                           "setStreamHandler there is no event stream com.quorvel.dispatch.other"),
            1U);
}

TEST_F(EventSourcesOnLinux, AMountMakesTheStreamLookAtOnce) {
  ASSERT_EQ(::geteuid(), 0U) << "this test mounts and has to run as root";
  ASSERT_EQ(::unshare(CLONE_NEWNS), 0);
  ASSERT_EQ(::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
  CountingSemaphore handled(0);
  Dictionary event;
  const auto events = make();
  events->setStreamHandler("com.quorvel.dispatch.vfs", global_, [&](const Dictionary& got) {
    event = got;
    handled.signal();
  });
  ASSERT_TRUE(comesTrue([&] { return space_.looks == 1; }));
  space_.is_low = true;
  ASSERT_EQ(::mount("none", directory_.path().c_str(), "tmpfs", 0, nullptr), 0);
  handled.wait();  // the next look of its own would be hours away
  EXPECT_EQ(event, (Dictionary{{"_Flags", 4}}));
  ASSERT_EQ(::umount2(directory_.path().c_str(), MNT_DETACH), 0);
}

TEST_F(EventSourcesOnLinux, AMountIsNoticedThoughTheEventThreadWasBusyWhenTheStreamBegan) {
  ASSERT_EQ(::geteuid(), 0U) << "this test mounts and has to run as root";
  ASSERT_EQ(::unshare(CLONE_NEWNS), 0);
  ASSERT_EQ(::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr), 0);
  const auto loop = std::make_shared<EventLoop>();
  // Held up until a mount has followed a look, or a fifth of a second if no look comes before.
  CountingSemaphore mounted(0);
  loop->post([&] { static_cast<void>(mounted.waitForNs(200'000'000)); });
  const auto events = make(loop);
  std::atomic<bool> handled = false;
  events->setStreamHandler("com.quorvel.dispatch.vfs", global_,
                           [&](const Dictionary&) { handled = true; });
  ASSERT_TRUE(comesTrue([&] { return space_.looks == 1; }));
  space_.is_low = true;
  ASSERT_EQ(::mount("none", directory_.path().c_str(), "tmpfs", 0, nullptr), 0);
  mounted.signal();
  EXPECT_TRUE(comesTrue([&] { return handled.load(); }));
  ASSERT_EQ(::umount2(directory_.path().c_str(), MNT_DETACH), 0);
}

TEST_F(EventSourcesOnLinux, ChangedThresholdsMakeTheStreamLookAtOnce) {
  auto sources = make();
  CountingSemaphore handled(0);
  sources->setStreamHandler(kVolumeEventStream, global_,
                            [&](const Dictionary&) { handled.signal(); });
  ASSERT_TRUE(comesTrue([&] { return space_.looks >= 1; }));
  space_.is_low = true;
  space_.thresholds_changed.get()();
  handled.wait();
  sources.reset();
  EXPECT_EQ(space_.thresholds_changed.get(), nullptr);  // nobody to tell any more
}

TEST_F(EventSourcesOnLinux, ReadinessGoesToTheServiceManager) {
  const NotifySocket manager(directory_);
  const auto events = make();
  EXPECT_EQ(events->postNotification("com.quorvel.spacekeep.launched"), 0);
  EXPECT_EQ(manager.next(), "READY=1");
}

TEST_F(EventSourcesOnLinux, WithoutAServiceManagerPostingSucceeds) {
  ::unsetenv("NOTIFY_SOCKET");
  EXPECT_EQ(make()->postNotification("com.quorvel.spacekeep.launched"), 0);
}

TEST_F(EventSourcesOnLinux, AServiceManagerThatCannotBeToldGivesItsError) {
  ::setenv("NOTIFY_SOCKET", "/nowhere/notify", 1);
  EXPECT_EQ(make()->postNotification("com.quorvel.spacekeep.launched"), ENOENT);
  ::unsetenv("NOTIFY_SOCKET");
}

TEST_F(EventSourcesOnLinux, BusyAndIdleAreTold) {
  const NotifySocket manager(directory_);
  const auto events = make();
  {
    const KeepAliveTransaction outer(events->keepAlive());
    const KeepAliveTransaction inner(events->keepAlive());
    EXPECT_EQ(manager.next(), "STATUS=Working.");
  }
  EXPECT_EQ(manager.next(), "STATUS=Idle.");
  EXPECT_EQ(manager.next(0), "");
}

TEST(SleepInhibitor, IsHeldWhileATransactionLastsAndNotForAShortOne) {
  ConcurrentQueue global({});
  const auto loop = std::make_shared<EventLoop>();
  std::atomic<int> taken{0};
  std::weak_ptr<ipc::Descriptor> held;
  CountingSemaphore took(0);
  LinuxKeepAlive keep_alive(
      loop, global,
      [&] {
        auto inhibitor = std::make_shared<ipc::Descriptor>(::dup(0));
        held = inhibitor;
        ++taken;
        took.signal();
        return inhibitor;
      },
      50'000'000);
  keep_alive.begin();
  took.wait();
  keep_alive.end();
  EXPECT_TRUE(comesTrue([&] { return held.expired(); }));
  EXPECT_EQ(taken, 1);
}

std::atomic<int> handled_signal{0};

TEST_F(EventSourcesOnLinux, TheTerminationHandlerIsCalledOnTheSignal) {
  const auto events = make();
  events->installTerminationHandler([](int signal_number) { handled_signal = signal_number; });
  ::raise(SIGTERM);
  EXPECT_EQ(handled_signal, SIGTERM);
  ::signal(SIGTERM, SIG_DFL);
}

/// Parks in a process of its own whose probe answers well `good` times.
pid_t parkWithWatchdog(int good) {
  const pid_t child = ::fork();
  if (child != 0) return child;
  ::setenv("WATCHDOG_USEC", "300000", 1);
  ::unsetenv("WATCHDOG_PID");
  ConcurrentQueue global({});
  Space space;
  LinuxEventSources events(std::make_shared<EventLoop>(), global, space, {});
  events.setWatchdogProbe([left = good](std::uint64_t wait_ns) mutable {
    if (wait_ns != 100'000'000) ::_exit(2);
    return left-- > 0;
  });
  events.park();
  ::_exit(1);
}

TEST(Watchdog, IsKeptQuietOnlyWhileTheProbeAnswers) {
  const ScratchDirectory directory;
  const NotifySocket manager(directory);
  const pid_t child = parkWithWatchdog(3);
  for (int i = 0; i < 3; ++i) EXPECT_EQ(manager.next(), "WATCHDOG=1");
  EXPECT_EQ(manager.next(1000), "") << "the probe does not answer any more";
  EXPECT_EQ(::waitpid(child, nullptr, WNOHANG), 0) << "it goes on, ending it is not its business";
  ::kill(child, SIGKILL);
  ::waitpid(child, nullptr, 0);
}

}  // namespace
}  // namespace spacekeep
