#include "services/cachedir/index/event_inbox.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <iterator>
#include <utility>

#include "services/cachedir/engine/elapsed.h"
#include "support/runtime/locks.h"

namespace spacekeep::cachedir {
namespace {

constexpr std::uint32_t kStructure =
    IN_CREATE | IN_DELETE | IN_MOVED_FROM | IN_MOVED_TO | IN_ATTRIB;
// IN_ACCESS and IN_MODIFY are also how the kernel tells of utimensat(2) with one of the two times.
// Opening and closing frame what is done through a mapping, of which nothing else tells.
constexpr std::uint32_t kContent =
    IN_ACCESS | IN_MODIFY | IN_OPEN | IN_CLOSE_WRITE | IN_CLOSE_NOWRITE;
constexpr std::uint32_t kCloses = IN_CLOSE_WRITE | IN_CLOSE_NOWRITE;

bool settled(std::uint64_t at_ticks, std::uint64_t settle_ns) {
  return settle_ns == 0 || elapsedNs(at_ticks) > settle_ns;
}

}  // namespace

EventInbox::EventInbox(Bounds bounds)
    : bounds_(bounds), poke_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

EventInbox::~EventInbox() {
  {
    const std::scoped_lock lock(mutex_);
    ending_ = true;
    poke();
  }
  if (thread_.joinable()) thread_.join();
}

void EventInbox::poke() {
  const std::uint64_t one = 1;
  static_cast<void>(!::write(poke_.get(), &one, sizeof one));
}

void EventInbox::startThread() {
  if (!bounds_.own_thread || thread_.joinable()) return;
  thread_ = rt::Thread("cachedir-events", [this] { listen(); });
}

void EventInbox::listen() {
  for (;;) {
    pollfd watched[2] = {{poke_.get(), POLLIN, 0}, {-1, POLLIN, 0}};
    {
      const std::scoped_lock lock(mutex_);
      if (ending_) return;
      watched[1].fd = events_.get();
    }
    if (::poll(watched, 2, -1) < 0) continue;
    {
      const std::scoped_lock lock(mutex_);
      ++wake_ups_;
      std::uint64_t pokes = 0;
      if (!ending_) static_cast<void>(!::read(poke_.get(), &pokes, sizeof pokes));
      readAll();
    }
    ::poll(watched, 1, static_cast<int>(kPauseNs / kNsPerMs));
  }
}

EventInbox::Added EventInbox::add(int fd, const WatchOwner& owner, std::uint64_t settle_ns) {
  const std::scoped_lock lock(mutex_);
  if (!events_) {
    events_.reset(::inotify_init1(IN_CLOEXEC | IN_NONBLOCK));
    if (!events_) return {Outcome::kNoRoom, -1, {}};
    poke();  // the thread may sleep on an earlier one
  }
  startThread();
  const std::string path = "/proc/self/fd/" + std::to_string(fd);
  if (watched_.size() >= bounds_.max_watches) return {Outcome::kNoRoom, -1, {}};
  const int watch =
      ::inotify_add_watch(events_.get(), path.c_str(), kStructure | kContent | IN_ONLYDIR);
  if (watch < 0) return {errno == ENOSPC ? Outcome::kNoRoom : Outcome::kFailed, -1, {}};
  const auto [place, fresh] = watched_.try_emplace(watch);
  if (!fresh) return {Outcome::kTaken, watch, place->second.owner};
  place->second.owner = owner;
  place->second.settle_ns = settle_ns;
  return {Outcome::kWatched, watch, {}};
}

void EventInbox::remove(int watch) {
  const std::scoped_lock lock(mutex_);
  const auto known = watched_.find(watch);
  if (known == watched_.end()) return;
  // Fails when the directory is gone, and its watch with it.
  static_cast<void>(::inotify_rm_watch(events_.get(), watch));
  names_ -= known->second.names.size();
  active_.erase(watch);
  watched_.erase(known);
}

/// Events that are dropped here: those of directories that are not ours any more, and those of
/// directories being listed, which our own walks cause.
void EventInbox::hear(const inotify_event& event, std::string_view name, std::uint64_t now_ticks) {
  if ((event.mask & (IN_Q_OVERFLOW | IN_UNMOUNT)) != 0) {
    lost_ = true;
    return;
  }
  if (name.empty() || ((event.mask & IN_ISDIR) != 0 && (event.mask & kStructure) == 0)) return;
  const auto known = watched_.find(event.wd);
  if (known == watched_.end()) return;
  Watched& watched = known->second;
  active_.insert(event.wd);
  if (watched.whole) {
    watched.whole_at_ticks = now_ticks;
    return;
  }
  auto told = watched.names.find(name);
  if (told == watched.names.end()) {
    told = watched.names.emplace(name, Told{}).first;
    ++names_;
  }
  told->second.at_ticks = now_ticks;
  if ((event.mask & IN_OPEN) != 0) told->second.open = true;
  if ((event.mask & kCloses) != 0) told->second.open = false;
  if (watched.names.size() > bounds_.max_names_of_one) becomeWhole(watched, now_ticks);
  if (names_ > bounds_.max_names) becomeAllWhole(now_ticks);
}

void EventInbox::becomeWhole(Watched& watched, std::uint64_t now_ticks) {
  names_ -= watched.names.size();
  watched.names.clear();
  watched.whole = true;
  watched.whole_at_ticks = now_ticks;
}

void EventInbox::becomeAllWhole(std::uint64_t now_ticks) {
  for (const int watch : active_) {
    Watched& watched = watched_.at(watch);
    if (!watched.whole) becomeWhole(watched, now_ticks);
  }
}

void EventInbox::readAll() {
  if (!events_) return;
  alignas(inotify_event) std::array<char, 65536> buffer;
  const std::uint64_t now_ticks = rt::ticks();
  for (;;) {
    const ssize_t got = ::read(events_.get(), buffer.data(), buffer.size());
    if (got <= 0) break;
    for (std::size_t at = 0; at < static_cast<std::size_t>(got);) {
      inotify_event event{};
      std::memcpy(&event, buffer.data() + at, sizeof event);
      const char* name = buffer.data() + at + sizeof event;
      hear(event, {name, ::strnlen(name, event.len)}, now_ticks);
      at += sizeof event + event.len;
    }
  }
  if (lost_ && !watched_.empty()) loseEverything();
}

/// Closing ends all watches at once, and with them the cost of a directory that is too busy to be
/// followed, until somebody asks again.
void EventInbox::loseEverything() {
  watched_.clear();
  active_.clear();
  names_ = 0;
  events_.reset();
  poke();
}

Changed EventInbox::takeOf(Watched& watched) {
  Changed changed{watched.owner, watched.whole, {}};
  if (watched.whole && settled(watched.whole_at_ticks, watched.settle_ns)) watched.whole = false;
  for (auto told = watched.names.begin(); told != watched.names.end();) {
    changed.names.push_back(told->first);
    const bool again = told->second.open || !settled(told->second.at_ticks, watched.settle_ns);
    told = again ? std::next(told) : watched.names.erase(told);
  }
  names_ -= changed.names.size() - watched.names.size();
  return changed;
}

EventInbox::Taken EventInbox::take(const std::vector<bool>& of_roots) {
  const std::scoped_lock lock(mutex_);
  readAll();
  Taken taken;
  taken.lost = std::exchange(lost_, false);
  for (auto each = active_.begin(); each != active_.end();) {
    Watched& watched = watched_.at(*each);
    const std::size_t root = watched.owner.root;
    if (root >= of_roots.size() || !of_roots[root]) {
      ++each;
      continue;
    }
    taken.changed.push_back(takeOf(watched));
    each = watched.whole || !watched.names.empty() ? std::next(each) : active_.erase(each);
  }
  return taken;
}

std::size_t EventInbox::watches() const {
  const std::scoped_lock lock(mutex_);
  return watched_.size();
}

std::uint64_t EventInbox::wakeUps() const {
  const std::scoped_lock lock(mutex_);
  return wake_ups_;
}

}  // namespace spacekeep::cachedir
