#include "history/history.h"

#include <algorithm>
#include <iterator>
#include <utility>
#include <vector>

#include "history/page.h"
#include "support/logging/log.h"

namespace spacekeep {
namespace {

constexpr std::uint64_t kNsPerSecond = 1'000'000'000;
constexpr const char* kNotOpened = "it cannot be opened";

void dropOldest(std::deque<Dictionary>& entries, std::uint64_t& given_up) {
  while (entries.size() > History::kMaxWaiting) {
    entries.pop_front();
    ++given_up;
  }
}

}  // namespace

std::shared_ptr<History> History::create(Platform& platform) {
  if (!platform.openHistory) return nullptr;
  return std::make_shared<History>(Key{}, platform);
}

History::History(Key, Platform& platform)
    : platform_(platform),
      queue_(SerialQueue::create("com.quorvel.spacekeep_history", platform.global)) {}

void History::add(Dictionary entry) {
  bool first = false;
  waiting_.update([&](Waiting& waiting) {
    waiting.entries.push_back(std::move(entry));
    dropOldest(waiting.entries, waiting.given_up);
    first = !std::exchange(waiting.write_is_due, true);
  });
  if (first) writeAfter(kWriteDelayNs);
}

void History::writeAfter(std::uint64_t delay_ns) {
  platform_.after(delay_ns, [weak = weak_from_this()] {
    const auto self = weak.lock();
    if (self) self->queue_->async([self] { self->writeWhenDue(); });
  });
}

void History::writeWhenDue() {
  const auto problem = writeWaiting();
  bool again = false;
  waiting_.update([&](Waiting& waiting) {
    again = !waiting.entries.empty();
    waiting.write_is_due = again;
  });
  if (!again) return;
  // Without a problem, the next ones came while the last ones were written.
  const std::uint64_t pause_ns = problem ? retry_ns_ : kWriteDelayNs;
  if (problem) {
    logProblem("%s The history is not on the disk and is tried again in %llu s: %@", "writeHistory",
               pause_ns / kNsPerSecond, *problem);
    retry_ns_ = std::min(2 * retry_ns_, kLongestRetryNs);
  }
  writeAfter(pause_ns);
}

// What cannot be written goes back to the front, where it is the first to be given up.
std::optional<std::string> History::writeWaiting() {
  std::vector<Dictionary> entries;
  std::uint64_t given_up = 0;
  waiting_.update([&](Waiting& waiting) {
    entries.assign(std::make_move_iterator(waiting.entries.begin()),
                   std::make_move_iterator(waiting.entries.end()));
    waiting.entries.clear();
    given_up = std::exchange(waiting.given_up, 0);
  });
  if (given_up != 0) {
    logProblem("%s %llu entries of the history were given up, more than %llu wait for the disk",
               "writeHistory", given_up, std::uint64_t{kMaxWaiting});
  }
  if (entries.empty()) return std::nullopt;
  auto problem = store(entries);
  if (!problem) {
    retry_ns_ = kFirstRetryNs;
    return std::nullopt;
  }
  waiting_.update([&](Waiting& waiting) {
    waiting.entries.insert(waiting.entries.begin(), std::make_move_iterator(entries.begin()),
                           std::make_move_iterator(entries.end()));
    dropOldest(waiting.entries, waiting.given_up);
  });
  return problem;
}

std::optional<std::string> History::store(const std::vector<Dictionary>& entries) {
  HistoryStore* store = openedStore();
  return store == nullptr ? std::optional<std::string>(kNotOpened) : store->append(entries);
}

// Opened for the first entry or reader: a daemon that does nothing does not touch the disk.
HistoryStore* History::openedStore() {
  if (!store_) store_ = platform_.openHistory();
  return store_.get();
}

void History::page(Dictionary request, PageReply reply, PageFailure failed) {
  queue_->async([self = shared_from_this(), request = std::move(request), reply = std::move(reply),
                 failed = std::move(failed)] { self->answerPage(request, reply, failed); });
}

// Whoever asks wants to see what was done a second ago. What cannot be written is not shown, and is
// complained about when its time has come.
void History::answerPage(const Dictionary& request, const PageReply& reply,
                         const PageFailure& failed) {
  static_cast<void>(writeWaiting());
  HistoryStore* store = openedStore();
  if (store == nullptr) return failed(kNotOpened);
  history::Page page(history::limitOf(request));
  const auto problem = store->visit(history::rangeOf(request),
                                    [&](StoredEntry entry) { return page.take(std::move(entry)); });
  if (problem) return failed(*problem);
  reply(std::move(page).answer());
}

}  // namespace spacekeep
