// Thread safety: every member may be called from any thread; destroy it only after the last caller.
//
// The event stream for low space: a thread that looks at the volumes as often as LowSpaceWatch asks
// for, and sends what it reports as events {"_Flags": flags} to a handler. One event is handled at
// a time: purges run one after another anyway, so a second event could only wait inside the handler
// instead of here. Looking goes on meanwhile, and comes first when the handling ends.
#pragma once

#include <cstdint>
#include <functional>

#include "support/events/low_space_watch.h"
#include "support/queues/concurrent_queue.h"
#include "support/runtime/runtime.h"
#include "support/values/value.h"
#include "support/volumes/space_source.h"

namespace spacekeep {

class LowSpaceStream {
 public:
  using Handler = std::function<void(const Dictionary& event)>;

  /// Starts at once. `handler` runs on `queue`. All three must outlive the stream.
  LowSpaceStream(SpaceSource& source, ConcurrentQueue& queue, Handler handler,
                 WatchLimits limits = {});
  /// Waits for a handler that runs.
  ~LowSpaceStream();
  LowSpaceStream(const LowSpaceStream&) = delete;
  LowSpaceStream& operator=(const LowSpaceStream&) = delete;

  /// Looks now instead of later: the mount table has changed. Looks stay apart by the shortest
  /// pause however often this is called.
  void lookNow();

  /// How often the volumes were looked at.
  [[nodiscard]] std::uint64_t looks() const;

 private:
  void run();
  /// Looks, sends, and answers how long to pause.
  std::uint64_t lookOnce();
  void send(std::uint64_t flags);
  /// Answers false when the stream ends.
  bool pauseAfterLook(std::uint64_t looked_at_ticks, std::uint64_t pause_ns);

  SpaceSource& source_;
  ConcurrentQueue& queue_;
  const Handler handler_;
  const WatchLimits limits_;
  LowSpaceWatch watch_;  // confined to thread_
  mutable rt::Mutex mutex_;
  // Protected by mutex_.
  rt::CondVar changed_;
  bool stopping_ = false;
  bool look_wanted_ = false;
  bool handling_ = false;
  bool handling_ended_ = false;  // the watch has not been told yet
  std::uint64_t looks_ = 0;

  rt::Thread thread_;  // last: it uses all of the above
};

}  // namespace spacekeep
