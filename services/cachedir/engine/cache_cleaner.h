// Thread safety: every member may be called from any thread. Requests to free run one at a time, in
// no promised order; estimates run beside them and hold nothing up.
//
// The engine: frees files of the cache directories, least recently used first.
#pragma once

#include <array>
#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "services/cachedir/engine/candidates.h"
#include "services/cachedir/engine/estimate.h"
#include "services/cachedir/engine/file_source.h"
#include "services/cachedir/engine/open_files.h"
#include "services/cachedir/engine/roots.h"
#include "services/cachedir/engine/rules.h"
#include "services/cachedir/engine/tally.h"
#include "support/runtime/runtime.h"

namespace spacekeep::cachedir {

class CacheIndex;

struct FreeRequest {
  std::uint64_t amount = 0;  // bytes; 0 frees nothing
  int urgency = 0;           // 1 to 4; any other frees nothing
  /// A daily pass: everything that has been unused for the directory's periodic span, whatever the
  /// amount and the urgency.
  bool periodic = false;
  std::optional<std::string> volume = {};  // mount point; absent means all
  bool dry_run = false;
  /// Asked between files; true ends the request as cancel() does. May be empty.
  CancelToken::Question cancelled = {};
};

struct TakenFile {
  std::string path;
  std::uint64_t bytes = 0;
};
/// Told of each file as it goes (or would go), in order.
using TakenVisitor = std::function<void(const TakenFile&)>;

struct FreeResult {
  std::uint64_t bytes = 0;
  std::uint64_t files = 0;
  std::uint64_t directories = 0;
  bool cancelled = false;
  Tally left;
  std::vector<std::string> problems;  // in words
};

class CacheCleaner {
 public:
  struct Bounds {
    std::size_t max_files = 65536;  // candidates of one pass
    std::size_t max_text_bytes = 16 * 1024 * 1024;
  };

  struct Surroundings {
    /// Kept from request to request; null: each request walks.
    std::shared_ptr<CacheIndex> index = {};
    std::function<std::int64_t()> wall_clock_ns = rt::wallClockNs;
  };

  explicit CacheCleaner(Rules rules) : CacheCleaner(std::move(rules), Bounds{}) {}
  CacheCleaner(Rules rules, Bounds bounds)
      : CacheCleaner(std::move(rules), bounds, Surroundings{}) {}
  CacheCleaner(Rules rules, Bounds bounds, Surroundings surroundings)
      : rules_(std::move(rules)), bounds_(bounds), surroundings_(std::move(surroundings)) {}

  [[nodiscard]] FreeResult free(const FreeRequest& request, const TakenVisitor& taken = {});
  /// Without the checks that need a file to be opened, so it may promise a little too much.
  [[nodiscard]] Estimate estimate(const std::optional<std::string>& volume,
                                  const CancelToken& cancel = {}) const;
  /// Compares the index on that volume with the directories, for about `limit_ns`, and mends it.
  /// Answers what a person should know, in words.
  std::vector<std::string> verifyIndex(const std::optional<std::string>& volume,
                                       std::uint64_t limit_ns, const CancelToken& cancel = {});
  /// Ends every request to free that is running or waiting now; each answers with what it has done
  /// so far.
  void cancel();

  [[nodiscard]] const Rules& rules() const { return rules_; }

 private:
  class Run;
  bool begin(const CancelToken& cancel);
  void end();

  const Rules rules_;
  const Bounds bounds_;
  const Surroundings surroundings_;
  std::atomic<std::uint64_t> cancels_{0};

  rt::Mutex mutex_;
  rt::CondVar changed_;
  bool busy_ = false;  // guarded by mutex_

  OpenFiles open_files_;  // belongs to the request that is running
};

}  // namespace spacekeep::cachedir
