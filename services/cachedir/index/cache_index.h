// Thread safety: acquire may be called from any thread; everything else belongs to the one who
// holds the Use.
//
// All cache directories, indexed, as far as they can be. One request at a time works with the
// index; the others need not wait, they walk.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "services/cachedir/engine/cancel_token.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/index/event_inbox.h"
#include "services/cachedir/index/root_index.h"
#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {

class CacheIndex {
 public:
  struct Settings {
    IndexBounds bounds = {};
    EventInbox::Bounds inbox = {};
    /// No event tells that a file got a further name outside of the cache directories. What
    /// nobody has looked at for so long is therefore looked at again before it counts.
    std::uint64_t trust_ns = 6ULL * 3600 * 1'000'000'000;
  };
  CacheIndex() : CacheIndex(Settings{}) {}
  explicit CacheIndex(const Settings& settings) : settings_(settings), inbox_(settings.inbox) {}

  /// The right to work with the index, given back by its end.
  class Use {
   public:
    explicit Use(CacheIndex* index) : index_(index) {}
    Use(Use&& other) noexcept : index_(std::exchange(other.index_, nullptr)) {}
    Use& operator=(Use&&) = delete;
    ~Use() {
      if (index_ != nullptr) index_->giveBack();
    }
    CacheIndex* operator->() const { return index_; }

   private:
    CacheIndex* index_;
  };
  /// None when another request has it for all of `wait_ns`.
  [[nodiscard]] std::optional<Use> acquire(std::uint64_t wait_ns);

  enum class Effort {
    kIfReady,  // bring up to date what is indexed
    kBuild,    // and index what is not
  };
  struct Refreshed {
    /// For each root the index to ask, good until the Use ends; null: the root must be walked.
    std::vector<RootIndex*> indexed;
    std::vector<std::string> problems;  // what a person should know, each told once
  };
  /// Brings the index of these roots up to date. When cancelled some of them are not indexed.
  [[nodiscard]] Refreshed refresh(const std::vector<Root>& roots, Effort effort,
                                  const CancelToken& cancel);

  struct Verified {
    bool whole = true;              // all of these roots were compared to the end
    std::uint64_t differences = 0;  // names that were wrong without a reason known; now right
    std::vector<std::string> problems;
  };
  /// Compares the index of these roots with the directories, for about `limit_ns`. What was unfit
  /// to be indexed gets another try.
  [[nodiscard]] Verified verify(const std::vector<Root>& roots, std::uint64_t limit_ns,
                                const CancelToken& cancel);

  /// What happened so far, counted by cache directory.
  struct History {
    std::uint64_t built = 0;     // indexed from nothing
    std::uint64_t answered = 0;  // asked for, and the index had the answer
    std::uint64_t walked = 0;    // asked for, and it had not
    std::uint64_t losses = 0;    // times the kernel threw events away
  };
  [[nodiscard]] const History& history() const { return history_; }
  [[nodiscard]] const IndexTotals& totals() const { return totals_; }
  [[nodiscard]] const EventInbox& inbox() const { return inbox_; }

 private:
  void giveBack();
  RootIndex& of(const Root& root);
  void forgetWhatIsOther(const std::vector<Root>& roots, Effort effort, const CancelToken& cancel);
  bool playRound(const std::vector<Root>& roots, Effort effort, const CancelToken& cancel);
  void resetAll();
  [[nodiscard]] bool changedMeanwhile(const Root& root, const CancelToken& cancel);

  const Settings settings_;
  EventInbox inbox_;

  rt::Mutex mutex_;
  rt::CondVar changed_;
  bool busy_ = false;  // guarded by mutex_

  // From here on: of the one who holds the Use.
  IndexTotals totals_;
  History history_;
  std::map<std::string, std::uint32_t> numbers_;     // by path of the rule
  std::vector<std::unique_ptr<RootIndex>> indexes_;  // by number
};

}  // namespace spacekeep::cachedir
