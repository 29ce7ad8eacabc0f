// Thread safety: every member may be called from any thread.
//
// What inotify(7) tells of directories, gathered until somebody asks: per directory the names about
// which anything was told, each once, however often it was told. One thread sleeps until the kernel
// has something, takes all of it, and then lets at least a tenth of a second pass, so that a busy
// directory cannot make it wake more often than that. Nothing is looked at or changed here.
//
// The order in which things happened is not kept, and need not be: whoever takes the names looks at
// what stands there now.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "services/cachedir/engine/unique_fd.h"
#include "support/runtime/runtime.h"

struct inotify_event;

namespace spacekeep::cachedir {

/// Who a watch belongs to: a cache directory and a directory in it.
struct WatchOwner {
  std::uint32_t root = 0;
  std::uint32_t folder = 0;
  bool operator==(const WatchOwner&) const = default;
};

struct Changed {
  WatchOwner owner;
  bool whole = false;  // too many names to tell: look at everything in the directory
  std::vector<std::string> names;
};

class EventInbox {
 public:
  struct Bounds {
    /// Watches of our own, so that other programs of the user keep some. 1 KiB of the kernel each.
    std::size_t max_watches = 65536;
    /// Names kept, about 100 bytes each. Beyond it every directory that changed counts as changed
    /// as a whole.
    std::size_t max_names = 65536;
    /// The same for the names of one directory.
    std::size_t max_names_of_one = 16384;
    /// False: events are taken from the kernel only when somebody asks.
    bool own_thread = true;
  };
  static constexpr std::uint64_t kPauseNs = 100'000'000;

  EventInbox() : EventInbox(Bounds{}) {}
  explicit EventInbox(Bounds bounds);
  ~EventInbox();
  EventInbox(const EventInbox&) = delete;
  EventInbox& operator=(const EventInbox&) = delete;

  enum class Outcome { kWatched, kNoRoom, kTaken, kFailed };
  struct Added {
    Outcome outcome = Outcome::kFailed;
    int watch = -1;
    WatchOwner taken_by;  // with kTaken: the directory is watched already, on that one's behalf
  };
  /// Watches the directory `fd`. What is told of it is repeated at each take until nothing has been
  /// told for `settle_ns`, because the file system goes on working for so long.
  [[nodiscard]] Added add(int fd, const WatchOwner& owner, std::uint64_t settle_ns);
  void remove(int watch);

  struct Taken {
    /// The kernel had to throw events away, and all watches have ended: everything is unknown.
    bool lost = false;
    std::vector<Changed> changed;  // in the order in which the directories were watched
  };
  /// Everything told up to now of the directories of the roots that `of_roots` marks. A name that
  /// was opened and not closed again, or that has not settled, is told again at the next take.
  [[nodiscard]] Taken take(const std::vector<bool>& of_roots);

  [[nodiscard]] std::size_t watches() const;
  /// Times the thread of its own woke; for tests of what idling costs.
  [[nodiscard]] std::uint64_t wakeUps() const;

 private:
  struct Told {
    std::uint64_t at_ticks = 0;
    bool open = false;
  };
  struct Watched {
    WatchOwner owner;
    std::uint64_t settle_ns = 0;
    std::map<std::string, Told, std::less<>> names;
    bool whole = false;
    std::uint64_t whole_at_ticks = 0;
  };

  void listen();
  void poke();
  void startThread();
  void readAll();
  void hear(const inotify_event& event, std::string_view name, std::uint64_t now_ticks);
  void becomeWhole(Watched& watched, std::uint64_t now_ticks);
  void becomeAllWhole(std::uint64_t now_ticks);
  void loseEverything();
  [[nodiscard]] Changed takeOf(Watched& watched);

  const Bounds bounds_;
  UniqueFd poke_;  // wakes the thread: it ends, or the descriptor of events is another one

  mutable rt::Mutex mutex_;
  UniqueFd events_;                 // from here on guarded by mutex_
  std::map<int, Watched> watched_;  // by watch descriptor
  std::set<int> active_;            // those of which there is something to tell
  std::size_t names_ = 0;           // of all
  bool lost_ = false;
  bool ending_ = false;
  std::uint64_t wake_ups_ = 0;
  rt::Thread thread_;
};

}  // namespace spacekeep::cachedir
