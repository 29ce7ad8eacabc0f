#include "services/cachedir/engine/space_return.h"

#include <fcntl.h>
#include <sys/statvfs.h>
#include <unistd.h>

#include <atomic>
#include <memory>

#include "services/cachedir/engine/elapsed.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::uint64_t kBackgroundNs = 30 * kNsPerMs;   // before a flush is asked for
constexpr std::uint64_t kAfterFlushNs = 100 * kNsPerMs;  // somebody else may be writing: no longer
constexpr std::uint64_t kStepNs = 2 * kNsPerMs;

std::uint64_t freeBytes(int fd) {
  struct statvfs facts {};
  if (::fstatvfs(fd, &facts) != 0) return 0;
  return static_cast<std::uint64_t>(facts.f_bavail) * facts.f_frsize;
}

}  // namespace

SpaceReturn::SpaceReturn(int fd)
    : fd_(::fcntl(fd, F_DUPFD_CLOEXEC, 0)), free_before_(freeBytes(fd)) {}

bool SpaceReturn::isBack() const { return freeBytes(fd_.get()) >= free_before_ + expected_; }

bool SpaceReturn::poll(std::uint64_t limit_ns, const CancelToken& cancel) const {
  const std::uint64_t begin = rt::ticks();
  while (!isBack()) {
    if (cancel.cancelled() || elapsedNs(begin) >= limit_ns) return false;
    rt::sleepNs(kStepNs);
  }
  return true;
}

/// On a thread of its own, because syncfs(2) cannot be interrupted and a cancel must be obeyed.
void SpaceReturn::flush(const CancelToken& cancel) const {
  const auto done = std::make_shared<std::atomic<bool>>(false);
  const int copy = ::fcntl(fd_.get(), F_DUPFD_CLOEXEC, 0);
  if (copy < 0) return;
  rt::Thread thread("cachedir-flush", [done, copy] {
    const UniqueFd fd(copy);
    static_cast<void>(::syncfs(fd.get()));
    done->store(true, std::memory_order_release);
  });
  thread.detach();
  while (!done->load(std::memory_order_acquire) && !cancel.cancelled()) rt::sleepNs(kStepNs);
}

void SpaceReturn::wait(const CancelToken& cancel) {
  if (expected_ == 0 || !fd_ || poll(kBackgroundNs, cancel) || cancel.cancelled()) return;
  flush(cancel);
  poll(kAfterFlushNs, cancel);
}

}  // namespace spacekeep::cachedir
