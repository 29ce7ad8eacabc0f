// Thread safety: every member may be called from any thread.
//
// What the daemon has done, kept for people to look up. It stands beside the work and never in its
// way: an entry is only put down by the one who has it, and written later, together with others, on
// a queue that nobody else waits for. A disk that refuses costs entries and nothing else.
#pragma once

#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>

#include "support/history/history_store.h"
#include "support/platform.h"
#include "support/queues/serial_queue.h"
#include "support/runtime/guarded.h"

namespace spacekeep {

class History : public std::enable_shared_from_this<History> {
 private:
  struct Key {};

 public:
  /// Entries that wait for the disk; beyond that the oldest of them are given up.
  static constexpr std::size_t kMaxWaiting = 256;
  /// How late an entry is written: several in a row make one write.
  static constexpr std::uint64_t kWriteDelayNs = 5'000'000'000;
  /// When writing failed it is tried again after the first pause, then after twice as long, and so
  /// on up to the longest.
  static constexpr std::uint64_t kFirstRetryNs = 10'000'000'000;
  static constexpr std::uint64_t kLongestRetryNs = 3'600'000'000'000;

  using PageReply = std::function<void(Dictionary)>;
  /// Gets, in words, why the history cannot be read.
  using PageFailure = std::function<void(std::string why)>;

  /// Null when the platform keeps none.
  [[nodiscard]] static std::shared_ptr<History> create(Platform& platform);
  History(Key, Platform& platform);

  /// Returns at once.
  void add(Dictionary entry);
  /// Exactly one of the two runs, later, on the queue of the history. `request` and what the reply
  /// gets: "SPACEKEEP_BEFORE", "SPACEKEEP_LIMIT", "SPACEKEEP_VOLUME"; "SPACEKEEP_ENTRIES",
  /// "SPACEKEEP_NEXT". Shows what was added before the call.
  void page(Dictionary request, PageReply reply, PageFailure failed);

 private:
  struct Waiting {
    std::deque<Dictionary> entries;
    std::uint64_t given_up = 0;
    bool write_is_due = false;  ///< whenever there are entries
  };

  void writeAfter(std::uint64_t delay_ns);
  void writeWhenDue();
  [[nodiscard]] std::optional<std::string> writeWaiting();
  [[nodiscard]] std::optional<std::string> store(const std::vector<Dictionary>& entries);
  [[nodiscard]] HistoryStore* openedStore();
  void answerPage(const Dictionary& request, const PageReply& reply, const PageFailure& failed);

  Platform& platform_;
  const std::shared_ptr<SerialQueue> queue_;
  rt::Guarded<Waiting> waiting_;
  // Confined to queue_.
  std::unique_ptr<HistoryStore> store_;
  std::uint64_t retry_ns_ = kFirstRetryNs;
};

}  // namespace spacekeep
