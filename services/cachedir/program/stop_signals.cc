#include "services/cachedir/program/stop_signals.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <csignal>
#include <cstdint>

namespace spacekeep::cachedir {
namespace {

sigset_t stopSet() {
  sigset_t set;
  sigemptyset(&set);
  sigaddset(&set, SIGTERM);
  sigaddset(&set, SIGINT);
  return set;
}

void watch(int signals, int ending, const std::function<void()>& stop) {
  for (;;) {
    pollfd watched[2] = {{signals, POLLIN, 0}, {ending, POLLIN, 0}};
    if (::poll(watched, 2, -1) < 0) continue;
    if (watched[1].revents != 0) return;
    signalfd_siginfo info{};
    if (::read(signals, &info, sizeof info) == static_cast<ssize_t>(sizeof info)) stop();
  }
}

}  // namespace

void StopSignals::block() {
  const sigset_t set = stopSet();
  ::sigprocmask(SIG_BLOCK, &set, nullptr);
}

StopSignals::StopSignals(std::function<void()> stop) : ending_(::eventfd(0, EFD_CLOEXEC)) {
  const sigset_t set = stopSet();
  signals_.reset(::signalfd(-1, &set, SFD_CLOEXEC));
  thread_ = rt::Thread("stop-signals", [signals = signals_.get(), ending = ending_.get(),
                                        stop = std::move(stop)] { watch(signals, ending, stop); });
}

StopSignals::~StopSignals() {
  const std::uint64_t one = 1;
  static_cast<void>(!::write(ending_.get(), &one, sizeof one));
  thread_.join();
}

}  // namespace spacekeep::cachedir
